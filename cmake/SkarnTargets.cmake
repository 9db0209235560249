# Warnings, sanitizers and the one-static-library-per-folder convention.

set(SKARN_WARNINGS -Wall -Wextra -Werror -Wno-unused-parameter)
# GCC 12 at -O3 reports std::string and std::vector copies inlined from
# libstdc++ as overlapping or overflowing (false positives in its own headers);
# real out-of-bounds access is what the sanitizer builds are for.
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  list(APPEND SKARN_WARNINGS -Wno-restrict -Wno-stringop-overflow)
endif()

if(SKARN_SANITIZE)
  # GCC's flow analysis reports false "may be used uninitialized" warnings in
  # std::variant code once sanitizer instrumentation is added.
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    list(APPEND SKARN_WARNINGS -Wno-maybe-uninitialized)
  endif()
  string(REPLACE ";" "," _skarn_san "${SKARN_SANITIZE}")
  add_compile_options(-fsanitize=${_skarn_san} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${_skarn_san})
endif()

if(SKARN_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    message(FATAL_ERROR "SKARN_FUZZ=ON needs clang (CXX=clang++)")
  endif()
  # Undefined behaviour ends the run like any other finding.
  add_compile_options(-fsanitize=fuzzer-no-link,address,undefined -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=address,undefined)
endif()

# Shared libraries are linked with --no-undefined, except in sanitized clang
# builds: clang puts the sanitizer runtime only into executables, so the
# libraries' references to it stay undefined until load time.
set(SKARN_NO_UNDEFINED -Wl,--no-undefined)
if(CMAKE_CXX_COMPILER_ID MATCHES "Clang" AND (SKARN_SANITIZE OR SKARN_FUZZ))
  set(SKARN_NO_UNDEFINED "")
endif()

# Apply our warning set to a target of our own code.
function(skarn_warnings target)
  get_target_property(_type ${target} TYPE)
  if(_type STREQUAL "INTERFACE_LIBRARY")
    return()
  endif()
  target_compile_options(${target} PRIVATE ${SKARN_WARNINGS})
endfunction()

# skarn_folder_library(NAME DIR [DEPS ...]): every .cpp in DIR becomes one static
# library; a folder without sources yet gives an interface library so that
# dependants can name it already.
function(skarn_folder_library name dir)
  file(GLOB _srcs CONFIGURE_DEPENDS "${dir}/*.cpp")
  if(_srcs)
    add_library(${name} STATIC ${_srcs})
    target_include_directories(${name} PUBLIC ${dir})
    target_link_libraries(${name} PUBLIC ${ARGN})
    set_target_properties(${name} PROPERTIES CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON)
    skarn_warnings(${name})
  else()
    add_library(${name} INTERFACE)
    target_include_directories(${name} INTERFACE ${dir})
    target_link_libraries(${name} INTERFACE ${ARGN})
  endif()
endfunction()

# skarn_test_folder(NAME DIR LIBS...): one GoogleTest executable per test folder.
function(skarn_test_folder name dir)
  file(GLOB _srcs CONFIGURE_DEPENDS "${dir}/*.cpp")
  if(NOT _srcs)
    return()
  endif()
  add_executable(${name} ${_srcs})
  target_link_libraries(${name} PRIVATE ${ARGN} skarn_testsupport GTest::gtest_main GTest::gmock nlohmann_json::nlohmann_json)
  skarn_warnings(${name})
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT 60
    PROPERTIES ENVIRONMENT "SKARN_TEST_BINARY_DIR=${CMAKE_BINARY_DIR}")
endfunction()
