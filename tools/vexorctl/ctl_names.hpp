// The names people type for vexorctl: actions and audio commands by the names
// of their constants, folded ("RC_ACT_VOLUME_UP" is typed volume-up,
// Volume_Up, ...), and the numbers typed for them.
#pragma once

#include <cstddef>
#include <cstdint>

#include "common/actions.hpp"

// Longest user-facing name: "audio-cmd-toggle-shuffle" and the like.
inline constexpr std::size_t CTL_NAME_MAX = 32;

// The user-facing name of a constant: without its prefix, folded to lower
// case with '-' for '_' ("RC_ACT_VOLUME_UP", "RC_ACT_" -> "volume-up").
void CtlNameSlug(const char* name, const char* prefix, char (&out)[CTL_NAME_MAX]);

// Whether a typed name is the slug, case and '_' for '-' not mattering.
bool CtlNameMatches(const char* typed, const char* slug);

// The user-facing name of an action 0..25; false for values without a name.
bool CtlActionName(RcAction action, char (&out)[CTL_NAME_MAX]);

// An action by name, or by number: decimal, or "0x" and a 32-bit pattern.
bool CtlParseAction(const char* text, RcAction& out);

// Whether a word was meant as a number: digits after an optional sign.
bool CtlLooksNumeric(const char* text);

// A signed 32-bit decimal number, with nothing before or after it.
bool CtlParseDecimal(const char* text, std::int32_t& out);
