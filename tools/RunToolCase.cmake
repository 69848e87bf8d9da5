# Runs the vellum tool once for a ctest case and checks its exit status, its standard output and
# its standard error, so that the promise of one error line per failure is tested, not just the status.
#   cmake -DTOOL=<vellum> -DARGS=<arg|arg|...> -DSTATUS=<exit status>
#         [-DSTDOUT=<line|line|...>] [-DSTDOUT_MATCH=<regex>] [-DSTDERR_LINES=<n>] [-DSTDERR_MATCH=<regex>]
#         [-DSTDIN=<file>] -P RunToolCase.cmake
# Arguments and expected lines are separated by "|", which no notation or hex text uses.
cmake_minimum_required(VERSION 3.25)

string(REPLACE "|" ";" arguments "${ARGS}")
set(input)
if(DEFINED STDIN)
  set(input INPUT_FILE "${STDIN}")
endif()
execute_process(COMMAND "${TOOL}" ${arguments} ${input}
                RESULT_VARIABLE status OUTPUT_VARIABLE out ERROR_VARIABLE err)

set(problems)
if(NOT status STREQUAL "${STATUS}")
  list(APPEND problems "exit status ${status}, expected ${STATUS}")
endif()
if(DEFINED STDOUT)
  string(REPLACE "|" "\n" expected "${STDOUT}")
  if(NOT out STREQUAL "${expected}\n")
    list(APPEND problems "standard output differs; expected:\n${expected}\n")
  endif()
endif()
if(DEFINED STDOUT_MATCH AND NOT out MATCHES "${STDOUT_MATCH}")
  list(APPEND problems "standard output does not match '${STDOUT_MATCH}'")
endif()
if(DEFINED STDERR_LINES)
  string(REGEX MATCHALL "\n" newlines "${err}")
  list(LENGTH newlines lines)
  if(NOT lines EQUAL STDERR_LINES)
    list(APPEND problems "${lines} line(s) on standard error, expected ${STDERR_LINES}")
  endif()
endif()
if(DEFINED STDERR_MATCH AND NOT err MATCHES "${STDERR_MATCH}")
  list(APPEND problems "standard error does not match '${STDERR_MATCH}'")
endif()

if(problems)
  list(JOIN problems "\n  " text)
  string(REPLACE "|" " " shown "${ARGS}")
  message(FATAL_ERROR "vellum ${shown}:\n  ${text}\n--- standard output:\n${out}--- standard error:\n${err}")
endif()
