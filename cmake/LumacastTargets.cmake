# One place for what every target of the project shares: warnings, sanitizers, include roots.

include(BuildSummary)

add_library(lc_options INTERFACE)
target_compile_options(lc_options INTERFACE
  -Wall -Wextra -Wpedantic $<$<CXX_COMPILER_ID:GNU>:-Wshadow=local> $<$<CXX_COMPILER_ID:Clang>:-Wshadow> -Wnon-virtual-dtor -Woverloaded-virtual
  -Wimplicit-fallthrough -Werror
  # GCC 12 reports its own string code (GCC bug 105651), and reads of empty optionals that don't happen (bug 80635); the
  # sanitizers and clang watch for the real thing.
  $<$<CXX_COMPILER_ID:GNU>:-Wno-restrict> $<$<CXX_COMPILER_ID:GNU>:-Wno-maybe-uninitialized>
  -fno-omit-frame-pointer $<IF:$<CONFIG:Debug>,-g,-g1>)
if(LC_SANITIZE)
  # The checks that a sanitizer puts in make GCC 12 see sizes that don't occur.
  target_compile_options(lc_options INTERFACE -fsanitize=${LC_SANITIZE} -fno-sanitize-recover=all
    $<$<CXX_COMPILER_ID:GNU>:-Wno-stringop-overflow> $<$<CXX_COMPILER_ID:GNU>:-Wno-array-bounds>)
  target_link_options(lc_options INTERFACE -fsanitize=${LC_SANITIZE})
  target_compile_definitions(lc_options INTERFACE LC_SANITIZED=1)
endif()
if(LC_FUZZ)
  # The fuzzer follows everything that is compiled; only its targets are linked with its main function.
  target_compile_options(lc_options INTERFACE -fsanitize=fuzzer-no-link)
  target_link_options(lc_options INTERFACE -fsanitize=fuzzer-no-link)
endif()

# What is installed is hardened as Debian wants its packages, so that they can be made of any Release build. (The compiler's
# default there makes executables position-independent.) Tests are not: this would be none of what they look for.
add_library(lc_hardening INTERFACE)
if(NOT LC_SANITIZE)
  target_compile_options(lc_hardening INTERFACE $<$<CONFIG:Release>:-fstack-protector-strong>
    $<$<CONFIG:Release>:-D_FORTIFY_SOURCE=2>)
  target_link_options(lc_hardening INTERFACE $<$<CONFIG:Release>:-Wl,-z,relro,-z,now>)
endif()

# lc_sources_library(NAME SOURCES DEPS...): a static library of these sources, a list.
function(lc_sources_library name sources)
  add_library(${name} STATIC ${sources})
  target_link_libraries(${name} PUBLIC ${ARGN} PRIVATE lc_options lc_hardening)
  target_include_directories(${name} PUBLIC ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR})
endfunction()

# lc_library(NAME DIR DEPS...): a static library of all .cpp files of one folder (not of the folders below it).
function(lc_library name dir)
  file(GLOB sources CONFIGURE_DEPENDS ${dir}/*.cpp)
  if(sources)
    lc_sources_library(${name} "${sources}" ${ARGN})
  else()
    add_library(${name} INTERFACE)
    target_link_libraries(${name} INTERFACE ${ARGN})
    target_include_directories(${name} INTERFACE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR})
  endif()
endfunction()

# lc_pkg(NAME MODULES...): imported target PkgConfig::NAME for pkg-config modules, its headers as system headers.
function(lc_pkg name)
  pkg_check_modules(${name} QUIET IMPORTED_TARGET GLOBAL ${ARGN})
  if(NOT TARGET PkgConfig::${name})
    string(JOIN ", " modules ${ARGN})
    message(FATAL_ERROR "pkg-config does not find all of: ${modules} (scripts/setup installs what is needed)")
  endif()
  lc_note_packages(${name} ${ARGN})
endfunction()

# lc_optional_pkg(NAME MODULE CONSEQUENCE): the same for one module that may be missing, and what the build lacks then.
function(lc_optional_pkg name module consequence)
  pkg_check_modules(${name} QUIET IMPORTED_TARGET GLOBAL ${module})
  if(TARGET PkgConfig::${name})
    lc_note_packages(${name} ${module})
  else()
    lc_note_missing("${module}" "${consequence}")
  endif()
endfunction()

function(lc_note_packages name)
  foreach(module ${ARGN})
    set(version "${${name}_${module}_VERSION}")
    if(NOT version)
      set(version "${${name}_VERSION}")
    endif()
    lc_note_package("${module}" "${version}")
  endforeach()
endfunction()

# lc_executable(NAME SOURCES... DEPS libs...)
function(lc_executable name)
  cmake_parse_arguments(arg "" "" "SOURCES;DEPS" ${ARGN})
  add_executable(${name} ${arg_SOURCES})
  target_link_libraries(${name} PRIVATE ${arg_DEPS} lc_options lc_hardening)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR})
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/bin)
endfunction()

# Most of what a test spends is its compiling.
add_library(lc_test_options INTERFACE)
target_compile_options(lc_test_options INTERFACE $<$<CONFIG:Release>:-O1>)

# lc_join(TARGET): its files are compiled several at a time, as their headers cost more than they do. What they have in their
# nameless namespaces must differ, then.
function(lc_join target)
  set_target_properties(${target} PROPERTIES UNITY_BUILD ${LC_JOIN} UNITY_BUILD_BATCH_SIZE 6)
endfunction()

# lc_test(NAME DIR DEPS...): one GoogleTest binary of all .cpp files below one folder.
function(lc_test name dir)
  file(GLOB_RECURSE sources CONFIGURE_DEPENDS ${dir}/*.cpp)
  if(sources)
    add_executable(${name} ${sources})
    target_link_libraries(${name} PRIVATE ${ARGN} GTest::gtest GTest::gmock GTest::gtest_main lc_options)
    if(NOT name STREQUAL simulation_tests)  # which runs for as long as one wants
      target_link_libraries(${name} PRIVATE lc_test_options)
    endif()
    target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR})
    target_compile_definitions(${name} PRIVATE LC_SOURCE_DIR="${PROJECT_SOURCE_DIR}" LC_BINARY_DIR="${PROJECT_BINARY_DIR}")
  endif()
endfunction()
