# fileindex_add_test(NAME <name> SOURCES <files...> [LABELS <labels...>] [LIBS <libs...>])
# Builds one GoogleTest binary and registers each of its tests with ctest, so
# ctest -j runs them in parallel. Labels: "unit" runs in the sanitizer build
# too; "integration" starts real processes; "slow" marks the few long ones.
find_package(GTest REQUIRED)
include(GoogleTest)

function(fileindex_add_test)
  cmake_parse_arguments(T "" "NAME;TIMEOUT" "SOURCES;LABELS;LIBS" ${ARGN})
  add_executable(${T_NAME} ${T_SOURCES})
  target_link_libraries(${T_NAME} PRIVATE fileindex_internal GTest::gtest GTest::gmock GTest::gtest_main ${T_LIBS})
  if(NOT T_LABELS)
    set(T_LABELS unit)
  endif()
  if(NOT T_TIMEOUT)
    set(T_TIMEOUT 120)
  endif()
  # The source folder is compiled in: a property list cannot carry two
  # environment variables through test discovery.
  target_compile_definitions(${T_NAME} PRIVATE FILEINDEX_SOURCE_DIR="${PROJECT_SOURCE_DIR}")
  gtest_discover_tests(${T_NAME}
    DISCOVERY_MODE PRE_TEST
    PROPERTIES LABELS "${T_LABELS}" TIMEOUT ${T_TIMEOUT}
      ENVIRONMENT "FILEINDEX_BUILD_DIR=${PROJECT_BINARY_DIR}")
endfunction()

# The layer rule of docs/layers.md: no include points up a layer. A unit test,
# so the sanitizer build runs it too; scripts/test also runs it before building.
find_package(Python3 REQUIRED COMPONENTS Interpreter)
add_test(NAME check_layers COMMAND Python3::Interpreter ${PROJECT_SOURCE_DIR}/scripts/check-layers ${PROJECT_SOURCE_DIR})
set_tests_properties(check_layers PROPERTIES LABELS unit TIMEOUT 60)
