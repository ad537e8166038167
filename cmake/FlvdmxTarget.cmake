# What all targets share: language level, warnings and, with FLVDMX_SANITIZE, the sanitizers.

set(FLVDMX_WARNINGS -Wall -Wextra -Wconversion -Wsign-conversion -Wshadow -Werror)

function(flvdmx_target target)
    target_compile_features(${target} PRIVATE c_std_11 cxx_std_17)
    set_target_properties(${target} PROPERTIES C_EXTENSIONS OFF CXX_EXTENSIONS OFF)
    target_compile_options(${target} PRIVATE ${FLVDMX_WARNINGS} -ffile-prefix-map=${PROJECT_SOURCE_DIR}/=)
    if(CMAKE_CROSSCOMPILING) # silences notes on the ABI of older compilers
        target_compile_options(${target} PRIVATE $<$<COMPILE_LANGUAGE:CXX>:-Wno-psabi>)
    endif()
    if(FLVDMX_SANITIZE)
        set(flags -fsanitize=address,undefined,float-cast-overflow -fno-sanitize-recover=all)
        target_compile_options(${target} PRIVATE ${flags} -fno-omit-frame-pointer)
        # The g++ manual says that this warning gives false positives in instrumented code; the release build keeps it.
        target_compile_options(${target} PRIVATE $<$<CXX_COMPILER_ID:GNU>:-Wno-maybe-uninitialized>)
        target_compile_definitions(${target} PRIVATE _GLIBCXX_ASSERTIONS)
        target_link_options(${target} PRIVATE ${flags})
    endif()
endfunction()
