# Tests of the interface itself, run in every preset, cross builds included: each public header alone in the languages
# that it is for, and what the library exports and imports.

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

# A sanitizer brings symbols of its own; without optimisation the compiler is free to call more of its library.
if(CMAKE_BUILD_TYPE STREQUAL "Release" AND NOT FLVDMX_SANITIZE)
    add_test(NAME ${FLVDMX_TEST_PREFIX}symbols
        COMMAND ${Python3_EXECUTABLE} -B ${PROJECT_SOURCE_DIR}/tests/check_symbols.py
            ${CMAKE_NM} ${CMAKE_READELF} ${PROJECT_SOURCE_DIR}/flvdmx
            ${PROJECT_SOURCE_DIR}/flvdmx/flvdmx.map ${PROJECT_SOURCE_DIR} $<TARGET_FILE:flvdmx>)
endif()
