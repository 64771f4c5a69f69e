# A folder's build file is a table: one call a target, sources and links as lists of names.
# Includes are written from the repository root; a target's LINKS are the law of what it may include.

function(calmframe_library name)
  cmake_parse_arguments(ARG "SHARED" "" "SOURCES;LINKS" ${ARGN})
  if(NOT ARG_SOURCES)
    add_library(${name} INTERFACE)
    target_include_directories(${name} INTERFACE "${PROJECT_SOURCE_DIR}")
    target_link_libraries(${name} INTERFACE ${ARG_LINKS})
    return()
  endif()
  if(ARG_SHARED)
    add_library(${name} SHARED ${ARG_SOURCES})
  else()
    add_library(${name} STATIC ${ARG_SOURCES})
  endif()
  target_include_directories(${name} PUBLIC "${PROJECT_SOURCE_DIR}")
  target_link_libraries(${name} PUBLIC ${ARG_LINKS})
  # A source that is compiled for every instruction set includes itself, so it can't be joined with others.
  foreach(source IN LISTS ARG_SOURCES)
    file(STRINGS "${source}" includes_itself REGEX "define HWY_TARGET_INCLUDE" LIMIT_COUNT 1)
    if(includes_itself)
      set_source_files_properties("${source}" PROPERTIES SKIP_UNITY_BUILD_INCLUSION ON)
      # What a file can do to a loop, it can do to that of the plainest machine; the tests take them all.
      if(CALMFRAME_FUZZ)
        set_source_files_properties("${source}" PROPERTIES COMPILE_DEFINITIONS HWY_COMPILE_ONLY_STATIC)
      endif()
    endif()
  endforeach()
endfunction()

function(calmframe_program name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINKS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_include_directories(${name} PRIVATE "${PROJECT_SOURCE_DIR}")
  target_link_libraries(${name} PRIVATE ${ARG_LINKS})
endfunction()

# calmframe_test(host_test [LABELS threads] [COST 1] SOURCES ... [SINGLE_THREADED ...] [LINKS ...] [DEPENDS ...] [DEFINITIONS ...]):
# adds tests to a program; folders that link alike share one. Every suite of a program is a test of ctest,
# "host_test.FrameCacheTest". Suites of a greater COST are run first: what takes minutes does not begin when all else is done.
# LABELS threads: what the thread sanitizer runs, built by the target thread_tests. SINGLE_THREADED: sources like the others whose
# tests, and what they test, start no thread: it has nothing to say of them, and its build leaves them out.
# The reference loops of most tests are short, so these programs are built quickly rather than to be quick; a source with long
# loops says so itself. Building them is a third of a check: several sources are compiled as one, and undefined behaviour is
# looked for in what they test.
set(test_options -Wno-conversion -O1)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  list(APPEND test_options -Wno-subobject-linkage)
endif()
if(CALMFRAME_SANITIZE MATCHES "undefined")
  list(APPEND test_options -fno-sanitize=undefined)
endif()
function(calmframe_test name)
  cmake_parse_arguments(ARG "" "LABELS;COST" "SOURCES;SINGLE_THREADED;LINKS;DEPENDS;DEFINITIONS" ${ARGN})
  if(NOT CALMFRAME_SANITIZE STREQUAL "thread")
    list(APPEND ARG_SOURCES ${ARG_SINGLE_THREADED})
  endif()
  if(NOT TARGET ${name})
    calmframe_program(${name} SOURCES ${ARG_SOURCES} LINKS ${ARG_LINKS} GTest::gmock GTest::gtest_main)
    target_compile_options(${name} PRIVATE ${test_options})
    set_target_properties(${name} PROPERTIES UNITY_BUILD ON)
    target_precompile_headers(${name} REUSE_FROM test_headers)
    set(list "${PROJECT_BINARY_DIR}/suites/${name}.cmake")
    if(NOT ARG_COST)
      set(ARG_COST 0)
    endif()
    add_custom_command(TARGET ${name} POST_BUILD
      COMMAND "${CMAKE_COMMAND}" -DPROGRAM=$<TARGET_FILE:${name}> -DNAME=${name} -DLABELS=${ARG_LABELS} -DCOST=${ARG_COST} -DLIST=${list}
        -P "${PROJECT_SOURCE_DIR}/cmake/ListSuites.cmake"
      BYPRODUCTS "${list}" VERBATIM)
    # A program that was not built has no list, and its absence must show.
    file(WRITE "${PROJECT_BINARY_DIR}/suites/include_${name}.cmake"
      "if(EXISTS \"${list}\")\n  include(\"${list}\")\nelse()\n  add_test(${name}_NOT_BUILT ${name}_NOT_BUILT)\nendif()\n")
    set_property(DIRECTORY APPEND PROPERTY TEST_INCLUDE_FILES "${PROJECT_BINARY_DIR}/suites/include_${name}.cmake")
    if("threads" IN_LIST ARG_LABELS)
      add_dependencies(thread_tests ${name})
    endif()
    add_dependencies(all_tests ${name})
  else()
    target_sources(${name} PRIVATE ${ARG_SOURCES})
    target_link_libraries(${name} PRIVATE ${ARG_LINKS})
  endif()
  if(ARG_DEPENDS)
    add_dependencies(${name} ${ARG_DEPENDS})
  endif()
  target_compile_definitions(${name} PRIVATE ${ARG_DEFINITIONS})
endfunction()

function(calmframe_bench name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LINKS" ${ARGN})
  calmframe_program(${name} SOURCES ${ARG_SOURCES} LINKS ${ARG_LINKS} benchmark::benchmark_main)
  target_compile_options(${name} PRIVATE -Wno-conversion)
endfunction()
