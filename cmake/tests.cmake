# GoogleTest from Debian's sources, built for each target by this project.
set(INSTALL_GTEST OFF CACHE BOOL "" FORCE)
set(BUILD_GMOCK OFF CACHE BOOL "" FORCE)
add_subdirectory(/usr/src/googletest ${CMAKE_BINARY_DIR}/googletest EXCLUDE_FROM_ALL)
# g++ 12 at -O2 and above reports -Wrestrict false positives inside
# GoogleTest's own string code: not ours to fix, and only noise in every build.
target_compile_options(gtest PRIVATE -Wno-restrict)
target_compile_options(gtest_main PRIVATE -Wno-restrict)

# Every test runs in its own private mount namespace (fresh /tmp, /run, /dev),
# so the built-in paths of the daemon can be used without touching the host.
set(VEXO_SANDBOX ${CMAKE_SOURCE_DIR}/tests/sandbox.sh)
if(CMAKE_CROSSCOMPILING_EMULATOR)
  list(JOIN CMAKE_CROSSCOMPILING_EMULATOR " " VEXO_EMULATOR_TEXT)
else()
  set(VEXO_EMULATOR_TEXT "")
endif()

file(GLOB SUPPORT_SOURCES CONFIGURE_DEPENDS tests/support/*.cpp)
add_library(vexotestsupport STATIC ${SUPPORT_SOURCES})
target_include_directories(vexotestsupport PUBLIC tests/support src)
target_link_libraries(vexotestsupport PUBLIC vexocore GTest::gtest vexo_warnings)
target_compile_definitions(vexotestsupport PUBLIC
  VEXO_BIN_DIR="${CMAKE_BINARY_DIR}/bin"
  VEXO_EMULATOR="${VEXO_EMULATOR_TEXT}"
  VEXO_SOURCE_DIR="${CMAKE_SOURCE_DIR}")

function(vexo_add_test kind src)
  get_filename_component(name ${src} NAME_WE)
  add_executable(${name} ${src})
  target_link_libraries(${name} PRIVATE vexotestsupport GTest::gtest_main)
  add_test(NAME ${kind}.${name}
           COMMAND ${VEXO_SANDBOX} ${CMAKE_CROSSCOMPILING_EMULATOR} $<TARGET_FILE:${name}>)
  set_tests_properties(${kind}.${name} PROPERTIES TIMEOUT 600 LABELS ${kind})
endfunction()

file(GLOB UNIT_TESTS CONFIGURE_DEPENDS tests/unit/test_*.cpp)
foreach(src ${UNIT_TESTS})
  vexo_add_test(unit ${src})
endforeach()

file(GLOB E2E_TESTS CONFIGURE_DEPENDS tests/e2e/e2e_*.cpp)
foreach(src ${E2E_TESTS})
  vexo_add_test(e2e ${src})
  get_filename_component(name ${src} NAME_WE)
  # End-to-end tests start the daemon and the tools: build them first.
  add_dependencies(${name} vexorcd ${VEXO_TOOLS})
endforeach()

file(GLOB SCRIPT_TESTS CONFIGURE_DEPENDS tests/scripts/test_*.sh)
foreach(src ${SCRIPT_TESTS})
  get_filename_component(name ${src} NAME_WE)
  add_test(NAME script.${name} COMMAND ${VEXO_SANDBOX} bash ${src})
  set_tests_properties(script.${name} PROPERTIES TIMEOUT 600 LABELS script
    ENVIRONMENT "VEXO_BIN_DIR=${CMAKE_BINARY_DIR}/bin;VEXO_SOURCE_DIR=${CMAKE_SOURCE_DIR};VEXO_EMULATOR=${VEXO_EMULATOR_TEXT}")
endforeach()

# Soak runs (tests/soak/soak_*.cpp) start the real daemon like the end-to-end
# tests. ctest runs a short one; tests/soak/run.sh runs them for longer.
file(GLOB SOAK_TESTS CONFIGURE_DEPENDS tests/soak/soak_*.cpp)
foreach(src ${SOAK_TESTS})
  vexo_add_test(soak ${src})
  get_filename_component(name ${src} NAME_WE)
  add_dependencies(${name} vexorcd)
  set_tests_properties(soak.${name} PROPERTIES ENVIRONMENT "VEXO_SOAK_SECONDS=40")
endforeach()

# The first process of the PowerPC machine that tests/kernel/run.sh boots.
add_executable(kernel-init tests/kernel/init.cpp)
target_link_libraries(kernel-init PRIVATE vexocore vexo_warnings)
target_link_options(kernel-init PRIVATE -static-libstdc++ -static-libgcc)
