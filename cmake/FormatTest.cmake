# The test "format" checks that all sources are formatted by clang-format, as `./dev format` does it.

find_program(CLANG_FORMAT clang-format REQUIRED)

foreach(folder IN ITEMS flvdmx host tools gst examples packaging tests bench fuzz)
    file(GLOB_RECURSE found CONFIGURE_DEPENDS RELATIVE ${PROJECT_SOURCE_DIR} ${folder}/*.cpp ${folder}/*.h
        ${folder}/*.hpp ${folder}/*.c)
    list(APPEND sources ${found})
endforeach()

add_test(NAME format COMMAND ${CLANG_FORMAT} --dry-run -Werror ${sources} WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
