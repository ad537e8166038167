# Checks of the sources, one test per file so that they run in parallel, and of the samples under valgrind.

find_program(CLANG_TIDY clang-tidy REQUIRED)
find_program(CPPCHECK cppcheck REQUIRED)
find_program(VALGRIND valgrind REQUIRED)

# Sources of the folders that this build compiles; headers are checked with the sources that include them. The tests and
# the bench are not checked with the path-sensitive analyzer: it takes minutes for the macros of one test file and
# complains about those of Google Benchmark, and the tests run with the sanitizers anyway.
file(GLOB_RECURSE compiled CONFIGURE_DEPENDS RELATIVE ${PROJECT_SOURCE_DIR}
    flvdmx/*.cpp host/*.c tools/*.cpp gst/*.cpp examples/*.c examples/*.cpp tests/*.cpp bench/*.cpp fuzz/*.cpp)
if(NOT FLVDMX_GSTREAMER)
    list(FILTER compiled EXCLUDE REGEX "(^|/)gst/|/(play|gst_bench)\\.cpp$")
endif()
foreach(source IN LISTS compiled)
    set(less "")
    if(source MATCHES "^(tests|bench)/")
        set(less --checks=-clang-analyzer-*)
    endif()
    # clang does not know g++'s options for link-time optimisation.
    add_test(NAME tidy/${source} COMMAND ${CLANG_TIDY} --quiet -p ${PROJECT_BINARY_DIR} ${less} ${source}
            --extra-arg=-Wno-ignored-optimization-argument
        WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
    set_tests_properties(tidy/${source} PROPERTIES LABELS tidy)
endforeach()

# Two more analyzers, for the library only: they find what clang's may miss, and take seconds.
file(GLOB library CONFIGURE_DEPENDS RELATIVE ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/flvdmx/*/*.cpp)
add_test(NAME cppcheck COMMAND ${CPPCHECK} --quiet --error-exitcode=1 --enable=warning,performance,portability
    --std=c++17 --language=c++ -I . ${library} WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    foreach(source IN LISTS library)
        add_test(NAME analyzer/${source} COMMAND ${CMAKE_CXX_COMPILER} -std=c++17 -O1 -fno-exceptions -fno-rtti
            -fanalyzer -Werror -I . -S -o /dev/null ${source} WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
    endforeach()
endif()

file(GLOB samples CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/tests/data/*.flv)
foreach(sample IN LISTS samples)
    cmake_path(GET sample STEM name)
    add_test(NAME valgrind/${name} COMMAND ${VALGRIND} --quiet --error-exitcode=99 --leak-check=full
        --errors-for-leak-kinds=definite,indirect,possible $<TARGET_FILE:flvdmx-tool> frames ${sample})
endforeach()
