# Flags that every target of this project is compiled with.
add_library(quarry_plain_flags INTERFACE)
target_include_directories(quarry_plain_flags INTERFACE ${PROJECT_SOURCE_DIR})
target_compile_options(quarry_plain_flags INTERFACE -Wall -Wextra -Wpedantic -Wshadow -Wconversion
                                                    $<$<BOOL:${QUARRY_WERROR}>:-Werror>)
# This compiler sees overlapping copies in the joining of strings when it optimises (GCC 105651).
if(CMAKE_CXX_COMPILER_ID STREQUAL GNU AND CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
  target_compile_options(quarry_plain_flags INTERFACE $<$<CONFIG:Release>:-Wno-restrict>)
endif()
# All but what must run without a sanitizer has these.
add_library(quarry_flags INTERFACE)
target_link_libraries(quarry_flags INTERFACE quarry_plain_flags)
if(QUARRY_SANITIZE)
  target_compile_options(quarry_flags INTERFACE -fsanitize=${QUARRY_SANITIZE} -fno-omit-frame-pointer
                                                -fno-sanitize-recover=all -O1)
  target_link_options(quarry_flags INTERFACE -fsanitize=${QUARRY_SANITIZE})
endif()

# quarry_test(SOURCE [LIBS...]) builds one test program from one source and registers its cases.
# The program is named after the source's place: tests/common/error_test.cpp is common_error_test.
function(quarry_test source)
  get_filename_component(absolute ${source} ABSOLUTE)
  file(RELATIVE_PATH relative ${PROJECT_SOURCE_DIR}/tests ${absolute})
  string(REGEX REPLACE "\\.cpp$" "" name ${relative})
  string(REPLACE "/" "_" name ${name})
  add_executable(${name} ${absolute})
  target_link_libraries(${name} PRIVATE quarry_flags test_support ${ARGN} GTest::gmock GTest::gtest)
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/tests)
  gtest_discover_tests(${name} TEST_PREFIX "${name}/" DISCOVERY_MODE PRE_TEST
                       NO_PRETTY_VALUES  # so that no name holds what differs from run to run
                       PROPERTIES TIMEOUT 300)
endfunction()

# quarry_tests_in(DIR [LIBS...]) does so for every *_test.cpp directly in DIR, so that no test
# source can be forgotten.
function(quarry_tests_in dir)
  file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/${dir}/*_test.cpp)
  foreach(source IN LISTS sources)
    quarry_test(${source} ${ARGN})
  endforeach()
endfunction()

# Installed programs find their libraries, and the libraries each other, wherever the tree is put.
file(RELATIVE_PATH libraries_from_programs ${CMAKE_INSTALL_FULL_BINDIR} ${CMAKE_INSTALL_FULL_LIBDIR})
set(CMAKE_INSTALL_RPATH $ORIGIN $ORIGIN/${libraries_from_programs})

# quarry_exports(LIBRARY MAP) shows only what the version script MAP names. Hidden visibility alone
# leaves instances of the standard library's templates visible.
function(quarry_exports library map)
  get_filename_component(absolute ${map} ABSOLUTE)
  target_link_options(${library} PRIVATE LINKER:--version-script=${absolute})
  set_property(TARGET ${library} APPEND PROPERTY LINK_DEPENDS ${absolute})
endfunction()
