# How our targets are made. Every one of them links telvane_options, which carries the warnings, the sanitizers and the
# include folder, so that a folder's CMakeLists.txt says nothing but its sources and its dependencies.

include(CheckLinkerFlag)

find_program(TELVANE_CCACHE ccache)
if(TELVANE_CCACHE AND NOT CMAKE_CXX_COMPILER_LAUNCHER)
  set(CMAKE_C_COMPILER_LAUNCHER "${TELVANE_CCACHE}")
  set(CMAKE_CXX_COMPILER_LAUNCHER "${TELVANE_CCACHE}")
endif()

add_library(telvane_options INTERFACE)
target_include_directories(telvane_options INTERFACE "${PROJECT_SOURCE_DIR}")
target_compile_features(telvane_options INTERFACE cxx_std_20 c_std_11)
target_compile_definitions(telvane_options INTERFACE
  $<$<CONFIG:Debug>:_GLIBCXX_ASSERTIONS>
  TELVANE_VERSION="${PROJECT_VERSION}")
target_compile_options(telvane_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wvla -Wformat=2 -Wundef -Werror
  # An options struct whose fields have defaults is initialised by naming the fields that differ.
  -Wno-missing-field-initializers
  $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor>
  $<$<COMPILE_LANGUAGE:CXX>:-Woverloaded-virtual>
  $<$<COMPILE_LANGUAGE:CXX>:-Wextra-semi>)

if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # GCC 12 sees overlapping copies inside std::string that are not there, more so the more it inlines.
  target_compile_options(telvane_options INTERFACE $<$<COMPILE_LANGUAGE:CXX>:-Wno-restrict>)
  if(TELVANE_SANITIZE)
    target_compile_options(telvane_options INTERFACE
      -Wno-maybe-uninitialized -Wno-stringop-overflow -Wno-stringop-overread -Wno-array-bounds)
  endif()
elseif(CMAKE_CXX_COMPILER_ID MATCHES "Clang")
  target_compile_options(telvane_options INTERFACE -Wthread-safety -Wno-gnu-zero-variadic-macro-arguments)
endif()

check_linker_flag(CXX -fuse-ld=lld TELVANE_HAS_LLD)
if(TELVANE_HAS_LLD)
  add_link_options(-fuse-ld=lld)
endif()

if(TELVANE_SANITIZE)
  string(REPLACE ";" "," telvane_sanitizers "${TELVANE_SANITIZE}")
  add_compile_options(-fsanitize=${telvane_sanitizers} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${telvane_sanitizers})
endif()
if(TELVANE_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    message(FATAL_ERROR "TELVANE_FUZZ needs Clang: use the preset fuzz")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()
if(TELVANE_COVERAGE)
  add_compile_options(--coverage -fprofile-update=atomic)
  add_link_options(--coverage)
endif()

function(_telvane_common target)
  target_link_libraries(${target} PRIVATE telvane_options)
  set_target_properties(${target} PROPERTIES
    POSITION_INDEPENDENT_CODE ON
    C_VISIBILITY_PRESET hidden
    CXX_VISIBILITY_PRESET hidden
    VISIBILITY_INLINES_HIDDEN ON)
endfunction()

# telvane_library(NAME SOURCES file... [PUBLIC dep...] [PRIVATE dep...] [HEADERS_ONLY])
#
# Makes the static library telvane_NAME of the files of one folder. A dependency that stands in a header which another
# folder includes is PUBLIC, any other PRIVATE. HEADERS_ONLY is for a folder without sources.
function(telvane_library name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "HEADERS_ONLY" "" "SOURCES;PUBLIC;PRIVATE")
  set(target telvane_${name})
  if(NOT arg_HEADERS_ONLY)
    add_library(${target} STATIC ${arg_SOURCES})
    _telvane_common(${target})
    target_link_libraries(${target} PUBLIC ${arg_PUBLIC} PRIVATE ${arg_PRIVATE})
  else()
    add_library(${target} INTERFACE)
    target_link_libraries(${target} INTERFACE ${arg_PUBLIC} ${arg_PRIVATE})
  endif()
  add_library(telvane::${name} ALIAS ${target})
endfunction()

# telvane_capnp_library(NAME SCHEMAS file...)
#
# Makes the static library telvane_NAME of the code generated from Cap'n Proto schemas. It is included by the schema's
# path from the root: "interfaces/Wire.capnp.h".
function(telvane_capnp_library name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SCHEMAS")
  set(output "${PROJECT_BINARY_DIR}/generated")
  file(MAKE_DIRECTORY "${output}")
  set(sources)
  foreach(schema IN LISTS arg_SCHEMAS)
    set(path "${CMAKE_CURRENT_SOURCE_DIR}/${schema}")
    file(RELATIVE_PATH relative "${PROJECT_SOURCE_DIR}" "${path}")
    set(generated "${output}/${relative}.c++" "${output}/${relative}.h")
    add_custom_command(OUTPUT ${generated}
      COMMAND "${TELVANE_CAPNP}" compile "-o${TELVANE_CAPNPC_CXX}:${output}"
              "--src-prefix=${PROJECT_SOURCE_DIR}" "${path}"
      DEPENDS "${path}" VERBATIM COMMENT "Generating ${relative}")
    list(APPEND sources ${generated})
  endforeach()
  add_library(telvane_${name} STATIC ${sources})
  add_library(telvane::${name} ALIAS telvane_${name})
  target_compile_options(telvane_${name} PRIVATE -w)
  target_include_directories(telvane_${name} SYSTEM PUBLIC "${output}")
  target_link_libraries(telvane_${name} PUBLIC CapnProto::capnp-rpc)
  set_target_properties(telvane_${name} PROPERTIES
    POSITION_INDEPENDENT_CODE ON CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON CXX_CLANG_TIDY "")
endfunction()

# telvane_program(NAME SOURCES file... [LINK dep...] [INSTALL])
#
# Makes the program NAME in <build>/bin; with INSTALL it belongs to the package.
function(telvane_program name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "INSTALL" "" "SOURCES;LINK")
  add_executable(${name} ${arg_SOURCES})
  _telvane_common(${name})
  target_link_libraries(${name} PRIVATE ${arg_LINK})
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${PROJECT_BINARY_DIR}/bin")
  if(arg_INSTALL)
    install(TARGETS ${name} RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}")
  endif()
endfunction()

# telvane_test(NAME SOURCES file... [LINK dep...] [LABELS label...] [DEPENDS target...] [NO_SUPPORT])
#
# Makes <build>/tests/telvane_NAME_test and registers each of its tests with ctest. Tests of foundation/ take NO_SUPPORT,
# because the fakes of tests/support/ stand on all that is above it. DEPENDS names programs that the tests start.
function(telvane_test name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "NO_SUPPORT" "" "SOURCES;LINK;LABELS;DEPENDS")
  set(target telvane_${name}_test)
  add_executable(${target} ${arg_SOURCES})
  _telvane_common(${target})
  target_link_libraries(${target} PRIVATE ${arg_LINK} GTest::gmock_main Threads::Threads)
  if(NOT arg_NO_SUPPORT)
    target_link_libraries(${target} PRIVATE telvane_support)
  endif()
  if(arg_DEPENDS)
    add_dependencies(${target} ${arg_DEPENDS})
  endif()
  target_compile_definitions(${target} PRIVATE
    TELVANE_SOURCE_DIR="${PROJECT_SOURCE_DIR}"
    TELVANE_PROGRAM_DIR="${PROJECT_BINARY_DIR}/bin")
  set_target_properties(${target} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${PROJECT_BINARY_DIR}/tests")
  if(NOT arg_LABELS)
    set(arg_LABELS unit)
  endif()
  gtest_discover_tests(${target} DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT 60
    PROPERTIES TIMEOUT 120 LABELS "${arg_LABELS}")
endfunction()
