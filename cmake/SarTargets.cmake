# sar_add_library(<name> SOURCES ... [PUBLIC_DEPS ...] [PRIVATE_DEPS ...])
# Builds library sar_<name> from one src/<name> folder; headers are included as "<name>/x.hpp".
function(sar_add_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;PUBLIC_DEPS;PRIVATE_DEPS" ${ARGN})
  if(NOT ARG_SOURCES)
    message(STATUS "sar_${name}: no sources yet, skipped")
    return()
  endif()
  add_library(sar_${name} STATIC ${ARG_SOURCES})
  target_include_directories(sar_${name} PUBLIC ${CMAKE_SOURCE_DIR}/src)
  target_link_libraries(sar_${name} PUBLIC ${ARG_PUBLIC_DEPS} PRIVATE sar_warnings ${ARG_PRIVATE_DEPS})
  if(SAR_SANITIZE)
    target_link_libraries(sar_${name} PUBLIC sar_warnings)
  endif()
endfunction()

# sar_add_test(<name> SOURCES ... DEPS ...)
# One gtest binary per subsystem, discovered by CTest. Tests run from the build folder and
# find the real sample files and the shipped data through compile definitions.
function(sar_add_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  if(NOT ARG_SOURCES)
    message(STATUS "test_${name}: no sources yet, skipped")
    return()
  endif()
  add_executable(test_${name} ${ARG_SOURCES})
  target_link_libraries(test_${name} PRIVATE ${ARG_DEPS} GTest::gtest GTest::gtest_main sar_warnings)
  target_compile_definitions(test_${name} PRIVATE
    SAR_REAL_DATA_DIR="${SAR_REAL_DATA_DIR}"
    SAR_DATA_DIR="${SAR_DATA_DIR}"
    SAR_BINARY_DIR="${CMAKE_BINARY_DIR}")
  gtest_discover_tests(test_${name} DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 300)
endfunction()
