# The README shows exactly the program that is compiled and run.

file(READ ${README} readme)
file(READ ${PROGRAM} program)
string(FIND "${readme}" "```cpp\n${program}```\n" position)
if(position EQUAL -1)
    message(FATAL_ERROR "${README} does not show the code of ${PROGRAM}")
endif()
