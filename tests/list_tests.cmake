# Writes down for CTest which tests a program holds. The build runs this when it has made the program:
#
#   cmake -D PROGRAM=FILE -D COMMAND=LIST -D FOLDER=FOLDER -D LIST=FILE -D SLOW=LIST
#     -P list_tests.cmake
#
# PROGRAM tells its tests, COMMAND runs them on an appliance, in FOLDER; LIST is the file to write. SLOW
# names those that take long.
cmake_minimum_required(VERSION 3.25)
execute_process(COMMAND ${PROGRAM} --gtest_list_tests OUTPUT_VARIABLE lines COMMAND_ERROR_IS_FATAL ANY)

# A comment tells the value of a parameter, which may hold anything.
string(REGEX REPLACE " *#[^\n]*" "" lines "${lines}")
string(REPLACE "\n" ";" lines "${lines}")
list(JOIN COMMAND "]==] [==[" command)
string(CONCAT tests "set(command [==[${command}]==])\nset(properties WORKING_DIRECTORY [==[${FOLDER}]==] TIMEOUT 600"
  " SKIP_REGULAR_EXPRESSION [==[\\[  SKIPPED \\]]==])\n")
foreach(line ${lines})
  if(NOT line MATCHES "^  ")
    set(suite ${line})
    continue()
  endif()
  string(STRIP ${suite}${line} test)
  string(REPLACE " " "" test ${test})
  # A test that is switched off would pass unseen, so it is run as well.
  string(APPEND tests
    "add_test(${test} \${command} --gtest_filter=${test} --gtest_also_run_disabled_tests)\n"
    "set_tests_properties(${test} PROPERTIES \${properties})\n")
  if(test IN_LIST SLOW)
    list(REMOVE_ITEM SLOW ${test})
    string(APPEND tests "set_tests_properties(${test} PROPERTIES LABELS slow COST 100)\n")
  endif()
endforeach()
if(SLOW)
  message(FATAL_ERROR "${PROGRAM} does not hold ${SLOW}")
endif()
file(WRITE ${LIST} "${tests}")
