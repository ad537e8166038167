# Installs the build into a prefix, moves the prefix, and uses it as a user would: builds its examples in C through
# pkg-config and in C and C++ through CMake, copies the host kit, and runs the tool. Called with BUILD, SOURCES, LIBDIR,
# CC and SAMPLE.

set(work ${BUILD}/consumer)
set(prefix ${work}/moved)
set(doc ${prefix}/share/doc/flvdmx)
set(ENV{LD_LIBRARY_PATH} ${prefix}/${LIBDIR})

function(run)
    execute_process(COMMAND ${ARGN} OUTPUT_VARIABLE output COMMAND_ERROR_IS_FATAL ANY)
    set(output ${output} PARENT_SCOPE)
endfunction()

function(expect text)
    if(NOT output MATCHES ${text})
        message(FATAL_ERROR "not found: ${text}\n${output}")
    endif()
endfunction()

file(REMOVE_RECURSE ${work})
run(${CMAKE_COMMAND} --install ${BUILD} --prefix ${work}/installed)
file(RENAME ${work}/installed ${prefix})

set(ENV{PKG_CONFIG_LIBDIR} ${prefix}/${LIBDIR}/pkgconfig)
run(pkg-config --cflags --libs flvdmx-host)
separate_arguments(flags UNIX_COMMAND "${output}")
run(${CC} ${doc}/examples/copy_frames.c -o ${work}/copy_frames ${flags})
run(${work}/copy_frames ${SAMPLE} audio ${work}/copied)
expect("109 frames, 10189 bytes")

foreach(example IN ITEMS "C list.c H264" "CXX seek.cpp reached 1" "CXX second_half.cpp keyframe ${work}/frames")
    separate_arguments(example)
    list(POP_FRONT example language source expected)
    run(${CMAKE_COMMAND} -S ${SOURCES}/tests/consumer -B ${work}/${source} -G Ninja -DCMAKE_PREFIX_PATH=${prefix}
        -DLANGUAGE=${language} -DSOURCE=${doc}/examples/${source})
    run(${CMAKE_COMMAND} --build ${work}/${source})
    run(${work}/${source}/consumer ${SAMPLE} ${example})
    expect(${expected})
endforeach()

run(pkg-config --cflags flvdmx)
separate_arguments(flags UNIX_COMMAND "${output}")
file(GLOB copied ${doc}/host/src/*.c)
run(${CC} -std=c11 -fsyntax-only ${flags} ${copied})

unset(ENV{LD_LIBRARY_PATH})
run(${prefix}/bin/flvdmx info ${SAMPLE})
expect("H.264")
