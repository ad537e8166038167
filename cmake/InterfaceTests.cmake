# Tests of the interface itself, run in every preset, cross builds included: the public header alone in both
# languages, and what the library exports and imports.

find_package(Python3 REQUIRED COMPONENTS Interpreter)

set(header ${PROJECT_SOURCE_DIR}/flvdmx/flvdmx.h)
set(header_flags ${FLVDMX_WARNINGS} -pedantic -fsyntax-only -I${PROJECT_SOURCE_DIR} -include flvdmx/flvdmx.h)
add_test(NAME ${FLVDMX_TEST_PREFIX}header_c11
    COMMAND ${CMAKE_C_COMPILER} -std=c11 ${header_flags} -Wstrict-prototypes -x c /dev/null)
add_test(NAME ${FLVDMX_TEST_PREFIX}header_cxx17
    COMMAND ${CMAKE_CXX_COMPILER} -std=c++17 ${header_flags} -x c++ /dev/null)

# A sanitizer brings symbols of its own; without optimisation the compiler is free to call more of its library.
if(CMAKE_BUILD_TYPE STREQUAL "Release" AND NOT FLVDMX_SANITIZE)
    add_test(NAME ${FLVDMX_TEST_PREFIX}symbols
        COMMAND Python3::Interpreter -B ${PROJECT_SOURCE_DIR}/tests/check_symbols.py
            --nm ${CMAKE_NM} --readelf ${CMAKE_READELF} --header ${header}
            --map ${PROJECT_SOURCE_DIR}/flvdmx/flvdmx.map --absent ${PROJECT_SOURCE_DIR} $<TARGET_FILE:flvdmx>)
endif()
