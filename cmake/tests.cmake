# GoogleTest from Debian's sources, built for each target by this project.
set(INSTALL_GTEST OFF CACHE BOOL "" FORCE)
set(BUILD_GMOCK OFF CACHE BOOL "" FORCE)
add_subdirectory(/usr/src/googletest ${CMAKE_BINARY_DIR}/googletest EXCLUDE_FROM_ALL)
# g++ 12 at -O2 and above reports -Wrestrict false positives inside
# GoogleTest's own string code: not ours to fix, and only noise in every build.
target_compile_options(gtest PRIVATE -Wno-restrict)
target_compile_options(gtest_main PRIVATE -Wno-restrict)

# Every test runs in its own private namespaces (fresh /tmp, /run, /var, /dev),
# so the built-in paths of the daemon can be used without touching the host.
set(VEXO_SANDBOX ${CMAKE_SOURCE_DIR}/tests/sandbox.sh)
if(CMAKE_CROSSCOMPILING_EMULATOR)
  list(JOIN CMAKE_CROSSCOMPILING_EMULATOR " " VEXO_EMULATOR_TEXT)
else()
  set(VEXO_EMULATOR_TEXT "")
endif()

# The test support (tests/support/harness.hpp) runs the build's programs.
add_library(vexotestsupport INTERFACE)
target_include_directories(vexotestsupport INTERFACE tests/support)
target_link_libraries(vexotestsupport INTERFACE vexotools GTest::gtest_main vexo_warnings)
target_compile_definitions(vexotestsupport INTERFACE
  VEXO_BIN_DIR="${CMAKE_BINARY_DIR}/bin"
  VEXO_EMULATOR="${VEXO_EMULATOR_TEXT}")

# Unit tests start the system logger's stand-in, end-to-end tests the daemon
# and every tool: all of them are built first.
file(GLOB TESTS CONFIGURE_DEPENDS tests/unit/test_*.cpp tests/e2e/e2e_*.cpp)
foreach(src ${TESTS})
  get_filename_component(name ${src} NAME_WE)
  get_filename_component(dir ${src} DIRECTORY)
  get_filename_component(kind ${dir} NAME)
  add_executable(${name} ${src})
  target_link_libraries(${name} PRIVATE vexotestsupport)
  add_dependencies(${name} vexorcd ${VEXO_TOOLS})
  add_test(NAME ${kind}.${name}
           COMMAND ${VEXO_SANDBOX} ${CMAKE_CROSSCOMPILING_EMULATOR} $<TARGET_FILE:${name}>)
  set_tests_properties(${kind}.${name} PROPERTIES TIMEOUT 300 LABELS ${kind})
endforeach()

file(GLOB SCRIPT_TESTS CONFIGURE_DEPENDS tests/scripts/test_*.sh)
foreach(src ${SCRIPT_TESTS})
  get_filename_component(name ${src} NAME_WE)
  add_test(NAME script.${name} COMMAND ${VEXO_SANDBOX} bash ${src})
  set_tests_properties(script.${name} PROPERTIES TIMEOUT 300 LABELS script
    ENVIRONMENT "VEXO_BIN_DIR=${CMAKE_BINARY_DIR}/bin;VEXO_SOURCE_DIR=${CMAKE_SOURCE_DIR};VEXO_EMULATOR=${VEXO_EMULATOR_TEXT}")
endforeach()

# The first process of the PowerPC machine that tests/kernel/run.sh boots.
add_executable(kernel-init tests/kernel/init.cpp)
target_link_libraries(kernel-init PRIVATE vexocore vexo_warnings)
target_link_options(kernel-init PRIVATE -static-libstdc++ -static-libgcc)
