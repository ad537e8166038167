# Builds the C example exactly as it is in the README, and runs it on the file that the other examples play.

set(readme ${PROJECT_SOURCE_DIR}/README.md)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${readme})
file(READ ${readme} text)
if(NOT text MATCHES "\n```c\n(.*)")
    message(FATAL_ERROR "README.md has no C example")
endif()
string(FIND "${CMAKE_MATCH_1}" "```" end)
string(SUBSTRING "${CMAKE_MATCH_1}" 0 ${end} example)
file(CONFIGURE OUTPUT ${PROJECT_BINARY_DIR}/readme_example.c CONTENT "${example}" @ONLY)

add_executable(readme-example ${PROJECT_BINARY_DIR}/readme_example.c)
flvdmx_target(readme-example)
target_link_libraries(readme-example PRIVATE flvdmx-host)
add_test(NAME ${FLVDMX_TEST_PREFIX}readme_example
    COMMAND readme-example ${PROJECT_BINARY_DIR}/dead_tags.flv)
set_tests_properties(${FLVDMX_TEST_PREFIX}readme_example PROPERTIES PASS_REGULAR_EXPRESSION "\n172 frames, at the end")
