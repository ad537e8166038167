# Tests of what users get in addition to the code: the installed copy, the packages, the manual pages, the binary
# interface and the reference. They run only in the build that is released.

find_package(Python3 REQUIRED COMPONENTS Interpreter)
find_program(ABIDW abidw REQUIRED)
find_program(ABIDIFF abidiff REQUIRED)
find_program(DOXYGEN doxygen REQUIRED)
find_program(MANDOC mandoc REQUIRED)
find_program(PKG_CONFIG pkg-config REQUIRED)

add_test(NAME consumer COMMAND ${CMAKE_COMMAND} -DBUILD=${PROJECT_BINARY_DIR} -DSOURCES=${PROJECT_SOURCE_DIR}
    -DLIBDIR=${CMAKE_INSTALL_LIBDIR} -DCC=${CMAKE_C_COMPILER} -DSAMPLE=${PROJECT_SOURCE_DIR}/tests/data/avc_aac.flv
    -P ${PROJECT_SOURCE_DIR}/tests/consumer/run.cmake)

# flvdmx_python_test(NAME SCRIPT ARGUMENT...)
function(flvdmx_python_test name script)
    add_test(NAME ${name} COMMAND ${Python3_EXECUTABLE} -B ${PROJECT_SOURCE_DIR}/tests/${script} ${ARGN})
endfunction()

flvdmx_python_test(packages check_packages.py ${CMAKE_CPACK_COMMAND} ${PROJECT_BINARY_DIR} ${PROJECT_VERSION}
    ${CMAKE_LIBRARY_ARCHITECTURE} ${FLVDMX_GSTREAMER})
set_tests_properties(consumer packages PROPERTIES RESOURCE_LOCK install_manifest) # both write it

set(manuals ${PROJECT_SOURCE_DIR}/docs/man)
flvdmx_python_test(options check_options.py $<TARGET_FILE:flvdmx-tool> ${manuals}/flvdmx.1
    ${PROJECT_SOURCE_DIR}/packaging/flvdmx.bash)
add_test(NAME manuals COMMAND ${MANDOC} -T lint -W warning ${manuals}/flvdmx.1 ${manuals}/QVX_FLV_DMX.3)

# Compares the binary interface with the released one. New functions are compatible; `abi-dump` records changes.
target_compile_options(flvdmx PRIVATE -g) # changes no code; packages are stripped
add_library(flvdmx-argument-types SHARED packaging/abi/argument_types.cpp)
flvdmx_target(flvdmx-argument-types)
target_compile_options(flvdmx-argument-types PRIVATE -g)
target_include_directories(flvdmx-argument-types PRIVATE ${PROJECT_SOURCE_DIR})
set_target_properties(flvdmx-argument-types PROPERTIES LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/abi)
add_custom_target(abi-dump)
foreach(target IN ITEMS flvdmx flvdmx-argument-types)
    set(dump ${PROJECT_SOURCE_DIR}/packaging/abi/lib${target}.${CMAKE_LIBRARY_ARCHITECTURE}.abi)
    add_custom_command(TARGET abi-dump VERBATIM COMMAND ${ABIDW} --exported-interfaces-only
        --drop-undefined-syms --no-elf-needed --no-show-locs --no-comp-dir-path --no-corpus-path
        --out-file ${dump} $<TARGET_FILE:${target}>)
    add_dependencies(abi-dump ${target})
    if(CMAKE_LIBRARY_ARCHITECTURE STREQUAL "x86_64-linux-gnu")
        add_test(NAME abi/${target} COMMAND ${ABIDIFF} --no-added-syms ${dump} $<TARGET_FILE:${target}>)
    endif()
endforeach()

add_custom_target(docs VERBATIM WORKING_DIRECTORY ${PROJECT_SOURCE_DIR}
    COMMAND ${CMAKE_COMMAND} -E env FLVDMX_VERSION=${PROJECT_VERSION} FLVDMX_DOCS=${PROJECT_BINARY_DIR}/docs
        ${DOXYGEN} docs/Doxyfile)
flvdmx_python_test(reference check_reference.py ${DOXYGEN} docs/Doxyfile ${PROJECT_BINARY_DIR}/reference)
set_tests_properties(reference PROPERTIES WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
