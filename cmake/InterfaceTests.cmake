# Tests of the interface, run in every preset and in cross builds: every public header compiles on its own in the
# languages that it supports, and the library exports and imports what it should.

find_package(Python3 REQUIRED COMPONENTS Interpreter)

set(header_flags ${FLVDMX_WARNINGS} -pedantic -fsyntax-only -I${PROJECT_SOURCE_DIR} -I${PROJECT_SOURCE_DIR}/host/include)
file(GLOB headers CONFIGURE_DEPENDS RELATIVE ${PROJECT_SOURCE_DIR}/host/include
    ${PROJECT_SOURCE_DIR}/host/include/flvdmx/*)
foreach(header IN LISTS headers ITEMS flvdmx/flvdmx.h flvdmx/layers.h)
    if(header MATCHES "\\.h$")
        add_test(NAME ${FLVDMX_TEST_PREFIX}c11/${header}
            COMMAND ${CMAKE_C_COMPILER} -std=c11 ${header_flags} -Wstrict-prototypes -include ${header} -x c /dev/null)
    endif()
    add_test(NAME ${FLVDMX_TEST_PREFIX}c++17/${header}
        COMMAND ${CMAKE_CXX_COMPILER} -std=c++17 ${header_flags} -fno-exceptions -fno-rtti -include ${header}
            -x c++ /dev/null)
endforeach()

# Sanitizers add symbols, and without optimisation the compiler calls more library functions.
if(CMAKE_BUILD_TYPE STREQUAL "Release" AND NOT FLVDMX_SANITIZE)
    add_test(NAME ${FLVDMX_TEST_PREFIX}symbols
        COMMAND ${Python3_EXECUTABLE} -B ${PROJECT_SOURCE_DIR}/tests/check_symbols.py
            ${CMAKE_NM} ${CMAKE_READELF} ${PROJECT_SOURCE_DIR}/flvdmx
            ${PROJECT_SOURCE_DIR}/flvdmx/flvdmx.map ${PROJECT_SOURCE_DIR} $<TARGET_FILE:flvdmx>)
endif()
