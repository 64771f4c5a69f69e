# Languages, warnings and sanitizers. Warnings stop a build only where CALMFRAME_WERROR asks for it (the checks), so that a
# newer compiler's new warnings never stop someone who just wants the program.

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_C_STANDARD_REQUIRED ON)
set(CMAKE_C_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)

if(NOT CMAKE_BUILD_TYPE)
  set(CMAKE_BUILD_TYPE Release)
endif()

find_program(CCACHE ccache)
if(CCACHE)
  set(CMAKE_CXX_COMPILER_LAUNCHER "${CCACHE}")
  set(CMAKE_C_COMPILER_LAUNCHER "${CCACHE}")
endif()

option(CALMFRAME_WERROR "Treat warnings as errors" OFF)
set(CALMFRAME_SANITIZE "" CACHE STRING "Sanitizers, as given to -fsanitize=")

# Two pixels computed by one formula must be bit-equal wherever they stand, so the compiler may not contract a*b+c on its
# own: a vector body and its scalar tail would round differently.
add_compile_options(-Wall -Wextra -Wshadow -Wconversion -Wno-sign-conversion -ffp-contract=off)
if(CALMFRAME_WERROR)
  add_compile_options(-Werror)
endif()
# Some compilers say so by themselves. A library that nothing calls brings others along: one of FFmpeg's loads OpenBLAS into
# the program, whose threads wait for ever at its end where memory is short.
add_link_options(-Wl,--as-needed)
# Several sources as one, the way of all presets but debug's to read every header fewer times: none of them is the main file
# any more, which is where GCC lets a type have members of an unnamed namespace.
if(CMAKE_UNITY_BUILD AND CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  add_compile_options($<$<COMPILE_LANGUAGE:CXX>:-Wno-subobject-linkage>)
endif()
# What is built for people reads strangers' files: an overrun ends the program, and nothing that it writes can be run or says
# where to go on. cmake/check-hardening looks whether a binary has it.
if(NOT CALMFRAME_SANITIZE AND NOT CMAKE_BUILD_TYPE STREQUAL "Debug")
  add_compile_options(-fstack-protector-strong -fstack-clash-protection -U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2)
  if(CMAKE_SYSTEM_PROCESSOR MATCHES "x86_64|AMD64")
    add_compile_options(-fcf-protection)
  endif()
  add_link_options(-Wl,-z,relro -Wl,-z,now -Wl,-z,noexecstack)
endif()
# For folders and targets without a long loop: instrumented code of theirs takes twice the time to optimise that it takes to
# compile. The fuzzers run the same code millions of times.
set(cold_options)
if(CALMFRAME_SANITIZE AND NOT CALMFRAME_FUZZ)
  set(cold_options -O0)
endif()
if(CALMFRAME_SANITIZE)
  # One instruction set for each width of vectors: instrumented, these sources took half of the time, and for memory and
  # arithmetic the two left out are the baseline's 16 bytes once more.
  if(CALMFRAME_SANITIZE STREQUAL "thread")
    # What a thread can do to a loop's data, it can do to that of any width. The plainest would do, but its loads and stores of
    # single numbers, each a call of the sanitizer, took six tenths of the tests' time.
    add_compile_definitions("HWY_DISABLED_TARGETS=(HWY_SSE4|HWY_SSSE3|HWY_AVX3)")
  else()
    add_compile_definitions("HWY_DISABLED_TARGETS=(HWY_SSE4|HWY_SSSE3)")
  endif()
  # -g1: a report needs lines, not variables, which cost a fifth of the build.
  add_compile_options(-fsanitize=${CALMFRAME_SANITIZE} -g1 -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${CALMFRAME_SANITIZE})
  # GCC's manual: instrumentation hides from this warning that a value is only read once it is set. The plain build warns.
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    add_compile_options(-Wno-maybe-uninitialized)
  endif()
endif()
