#!/bin/bash
# Mutation check: how many planted faults does the native suite catch?
#
# Each fault of scripts/mutants.txt is planted in turn into a copy of a
# tree's src/; the copy is rebuilt with the asan preset and its ctest suite is
# run (unit tests first, stopping at the first failure). A fault the suite
# fails on is "killed"; one it passes "SURVIVED". The tree itself is never
# changed. The last line is "mutation: K killed of N".
#
# Not part of the test command: one run takes about half an hour on two
# cores. Needs root, like the tests it runs.
#
# Usage: scripts/mutate.sh [--tree DIR] [--only LIST] [--work DIR]
#                          [--mutants FILE] [--timeout SECONDS] [--list | --build-only]
#   --tree DIR     the tree whose suite is measured (default: this repository)
#   --only LIST    only these mutants, by number: "3", "1,4,9-12"
#   --work DIR     the scratch copy and its build
#                  (default: build/mutate/NAME-OF-TREE in this repository)
#   --mutants FILE the fault list (default: scripts/mutants.txt beside this script)
#   --timeout S    a suite run longer than S seconds kills the mutant (default:
#                  twice the unmutated run plus two minutes)
#   --list         print each mutant and the line it makes in the tree; build nothing
#   --build-only   build each mutant and run no test (checks that the list compiles)
set -uo pipefail

# Two cores, shared with other builds: stay in the background.
if [ "$(nice)" -lt 10 ]; then
    exec nice -n $((10 - $(nice))) bash "$0" "$@"
fi

here=$(cd "$(dirname "$0")/.." && pwd)
tree=$here
work=
only=
mutants=$here/scripts/mutants.txt
limit=
list_only=0
build_only=0

usage() { sed -n '13,23s/^# \{0,1\}//p' "$0"; }

while [ $# -gt 0 ]; do
    case $1 in
    --tree) tree=${2:?}; shift 2 ;;
    --only) only=${2:?}; shift 2 ;;
    --work) work=${2:?}; shift 2 ;;
    --mutants) mutants=${2:?}; shift 2 ;;
    --timeout) limit=${2:?}; shift 2 ;;
    --list) list_only=1; shift ;;
    --build-only) build_only=1; shift ;;
    -h | --help) usage; exit 0 ;;
    *) usage >&2; exit 2 ;;
    esac
done

die() { echo "mutate.sh: $*" >&2; exit 2; }

tree=$(cd "$tree" 2>/dev/null && pwd) || die "no tree at $tree"
[ -d "$tree/src" ] || die "$tree has no src/"
[ -r "$mutants" ] || die "cannot read $mutants"

# ---- The fault list --------------------------------------------------------

declare -a m_desc=() m_anchor=() m_search=() m_repl=()

parse_mutants() {
    local line n=0 desc='' anchor='' search='' repl='' have_s=0 have_r=0
    flush() {
        [ -n "$desc" ] || return 0
        if [ "$have_s" != 1 ] || [ "$have_r" != 1 ] || [ -z "$search" ]; then
            die "$mutants:$n: mutant \"$desc\" needs a '- ' and a '+ ' line"
        fi
        m_desc+=("$desc"); m_anchor+=("$anchor"); m_search+=("$search"); m_repl+=("$repl")
        desc='' anchor='' search='' repl='' have_s=0 have_r=0
    }
    while IFS= read -r line || [ -n "$line" ]; do
        n=$((n + 1))
        case $line in
        '' | '#'*) flush ;;
        '@ '*) anchor=${line:2} ;;
        '- '*) search=${line:2}; have_s=1 ;;
        '+' | '+ '*) repl=${line:2}; have_r=1 ;;
        *)
            [ -z "$desc" ] || die "$mutants:$n: two descriptions in a row"
            desc=$line ;;
        esac
    done <"$mutants"
    flush
}
parse_mutants
total=${#m_desc[@]}
[ "$total" -gt 0 ] || die "no mutants in $mutants"

# The numbers selected by --only (1-based), or all.
declare -a selected=()
if [ -z "$only" ]; then
    for ((i = 1; i <= total; i++)); do selected+=("$i"); done
else
    IFS=, read -ra parts <<<"$only"
    for p in "${parts[@]}"; do
        if [[ $p =~ ^([0-9]+)-([0-9]+)$ ]]; then
            for ((i = BASH_REMATCH[1]; i <= BASH_REMATCH[2]; i++)); do selected+=("$i"); done
        elif [[ $p =~ ^[0-9]+$ ]]; then
            selected+=("$p")
        else
            die "bad --only item: $p"
        fi
    done
    for i in "${selected[@]}"; do
        if [ "$i" -lt 1 ] || [ "$i" -gt "$total" ]; then die "no mutant $i (there are $total)"; fi
    done
fi

# ---- Planting a fault --------------------------------------------------------

# Finds mutant $2 (0-based) in the tree $1, in code only (lines that begin a
# comment are passed over). Sets loc_file, loc_new (the file's mutated text)
# and loc_line (the mutated line), or loc_why and returns 1 when the mutant
# does not apply.
comment='[[:space:]]*(//|/\*|\*([[:space:]]|/|$))'
locate() {
    local root=$1 i=$2 key hit at line head tail k
    local anchor=${m_anchor[$i]} search=${m_search[$i]}
    key=${anchor:-$search}
    local -a hits lines
    mapfile -t hits < <(grep -rnF -- "$key" "$root/src" |
        grep -vE "^[^:]+:[0-9]+:$comment")
    hit=${hits[0]-}
    loc_file=${hit%%:*}
    at=${hit#*:}
    at=${at%%:*}
    if [ "${#hits[@]}" -ne 1 ]; then
        loc_why="\"$key\" is on ${#hits[@]} lines of code"
        return 1
    fi
    mapfile -t lines <"$loc_file"
    line=${lines[$((at - 1))]}
    if [[ ${line#*"$key"} == *"$key"* ]]; then
        loc_why="\"$key\" is in ${loc_file#"$root"/} more than once"
        return 1
    fi
    # With an anchor, the search text counts from the end of the anchor on.
    head=
    if [ -n "$anchor" ]; then
        head=${line%%"$anchor"*}$anchor
        line=${line#*"$anchor"}
        for ((k = at - 1; ; k++)); do
            [[ $line == *"$search"* ]] && break
            if [ $((k + 1)) -ge "${#lines[@]}" ]; then
                loc_why="\"$search\" does not follow \"$anchor\""
                return 1
            fi
            head=
            line=${lines[$((k + 1))]}
            [[ $line =~ ^$comment ]] && line=
        done
        at=$((k + 1))
    fi
    tail=${line#*"$search"}
    lines[at - 1]=$head${line%%"$search"*}${m_repl[$i]}$tail
    loc_line="$at: ${lines[$((at - 1))]}"
    loc_new=$(printf '%s\n' "${lines[@]}")$'\n'
    return 0
}

if [ "$list_only" = 1 ]; then
    for n in "${selected[@]}"; do
        if locate "$tree" $((n - 1)); then
            where=${loc_file#"$tree"/}:$loc_line
        else
            where="not applicable: $loc_why"
        fi
        printf '%2d  %s\n      %s\n' "$n" "${m_desc[$((n - 1))]}" "$where"
    done
    exit 0
fi

[ "$(id -u)" = 0 ] || die "must run as root (the tests use namespaces)"

# ---- The scratch copy ----------------------------------------------------------

work=${work:-$here/build/mutate/$(basename "$tree")}
mkdir -p "$work/logs" || die "cannot create $work"
work=$(cd "$work" && pwd)
copy=$work/tree
case $copy/ in "$tree"/ | "$tree"/src/*) die "the scratch copy must lie outside $tree's sources" ;; esac

exec 9>"$work/lock"
flock -n 9 || die "another mutation run uses $work"

# Makes dst hold the files of src (its build/ and .git aside). A file whose
# text is unchanged keeps its time stamp, so the build in dst stays
# incremental; a changed one gets a fresh stamp and is rebuilt.
sync_tree() {
    local src=$1 dst=$2 rel
    mkdir -p "$dst"
    while IFS= read -r -d '' rel; do
        if [ -L "$src/$rel" ] || [ -L "$dst/$rel" ]; then
            [ "$(readlink "$src/$rel")" = "$(readlink "$dst/$rel" 2>/dev/null)" ] && continue
            rm -f "$dst/$rel"
        elif cmp -s "$src/$rel" "$dst/$rel"; then
            continue
        fi
        mkdir -p "$(dirname "$dst/$rel")"
        cp -P "$src/$rel" "$dst/$rel" || return 1
    done < <(cd "$src" && find . \( -path ./build -o -name .git \) -prune -o \
        \( -type f -o -type l \) -printf '%P\0')
    while IFS= read -r -d '' rel; do
        [ -e "$src/$rel" ] || [ -L "$src/$rel" ] || rm -f "$dst/$rel"
    done < <(cd "$dst" && find . \( -path ./build -o -name .git \) -prune -o \
        \( -type f -o -type l \) -printf '%P\0')
}

# The mutated file and its text, for restoring.
planted_file=
planted_text=
restore() {
    [ -n "$planted_file" ] || return 0
    printf '%s' "$planted_text" >"$planted_file"
    touch "$planted_file"
    planted_file=
}
trap restore EXIT
trap 'restore; exit 130' INT TERM

# Builds the daemon first, then everything else: a mutant the daemon does
# not compile with is a broken one, while a test that no longer compiles
# (a size pinned at compile time, say) has caught it.
build() {  # $1: log file, $2: "all" or "daemon"
    (cd "$copy" && cmake --preset asan && cmake --build --preset asan --target vexorcd &&
        if [ "$2" = all ]; then cmake --build --preset asan; fi) >"$1" 2>&1 9>&-
}

# Runs the native suite, unit tests first, stopping at the first failure, in
# a pid namespace of its own: a test still hanging at the time limit dies
# with it (ctest's own time-outs are far longer), and a test that signals its
# process group by mistake takes down this run only.
suite() {  # $1: log file, $2: time limit in seconds
    (cd "$copy" && timeout -k 10 "$2" unshare --pid --fork --kill-child bash -c '
        ctest --preset asan --stop-on-failure --no-tests=ignore -L "^unit$" &&
        ctest --preset asan --stop-on-failure --no-tests=ignore -LE "^unit$"') >"$1" 2>&1 9>&-
}

# The first test that failed in a suite log, or how the run ended.
first_failure() {  # $1: log file, $2: exit status
    local name
    name=$(grep -m1 -E 'Test +#[0-9]+: .*(\*\*\*|Failed)' "$1" |
        sed -E 's/.*Test +#[0-9]+: ([^ ]+).*/\1/')
    if [ "$2" = build ]; then
        echo "test build"
    elif [ "$2" = 124 ] || [ "$2" = 137 ]; then
        # The tests started and never finished are the ones that hung.
        name=$(awk '/^ *Start +[0-9]+: / { started[$NF] = 1 }
            /Test +#[0-9]+: / { sub(/.*Test +#[0-9]+: /, ""); sub(/ .*/, ""); delete started[$0] }
            END { for (n in started) { printf "%s%s", sep, n; sep = " " } }' "$1")
        echo "time-out${name:+ in $name}"
    elif [ -n "$name" ]; then
        echo "$name"
    else
        echo "suite exit $2"
    fi
}

sync_tree "$tree" "$copy" || die "cannot copy $tree to $copy"
echo "mutating a copy of $tree in $copy"

# The unmutated suite must pass; its time sets the limit of the mutated runs.
start=$SECONDS
build "$work/logs/reference-build.log" all ||
    die "the unmutated tree does not build: $work/logs/reference-build.log"
built=$SECONDS
if [ "$build_only" = 0 ]; then
    suite "$work/logs/reference.log" 3600
    rc=$?
    [ "$rc" = 0 ] || die "the unmutated suite fails ($(first_failure "$work/logs/reference.log" "$rc")):" \
        "$work/logs/reference.log"
    ref=$((SECONDS - built))
    limit=${limit:-$((2 * ref + 120))}
    echo "unmutated: build $((built - start)) s, suite passes in $ref s; a mutated run may take $limit s"
fi

killed=0
counted=0
skipped=0
broken=0
for n in "${selected[@]}"; do
    i=$((n - 1))
    desc=${m_desc[$i]}
    tag=$(printf '%2d' "$n")
    if ! locate "$copy" "$i"; then
        printf 'n/a      %s %s (not applicable: %s)\n' "$tag" "$desc" "$loc_why"
        skipped=$((skipped + 1))
        continue
    fi
    planted_file=$loc_file
    planted_text=$(cat "$loc_file"; printf x)
    planted_text=${planted_text%x}
    printf '%s' "$loc_new" >"$loc_file"
    t0=$SECONDS
    log=$work/logs/mutant-$n.log
    if ! build "$log" daemon; then
        restore
        printf 'BROKEN   %s %s (does not compile: %s)\n' "$tag" "$desc" "$log"
        broken=$((broken + 1))
        continue
    fi
    if [ "$build_only" = 1 ]; then
        restore
        printf 'builds   %s %s\n' "$tag" "$desc"
        continue
    fi
    if ! build "$log" all; then
        rc=build
        echo "the test build failed" >"$log.suite"
    else
        suite "$log.suite" "$limit"
        rc=$?
    fi
    restore
    counted=$((counted + 1))
    if [ "$rc" = 0 ]; then
        printf 'SURVIVED %s %s (%s s)\n' "$tag" "$desc" $((SECONDS - t0))
    else
        killed=$((killed + 1))
        printf 'killed   %s %s (%s; %s s)\n' "$tag" "$desc" "$(first_failure "$log.suite" "$rc")" \
            $((SECONDS - t0))
    fi
done

[ "$skipped" = 0 ] || echo "not applicable: $skipped"
[ "$broken" = 0 ] || echo "broken (fix the list): $broken"
echo "time: $((SECONDS / 60)) min"
[ "$build_only" = 1 ] && exit $((broken > 0))
echo "mutation: $killed killed of $counted"
[ "$broken" = 0 ]
