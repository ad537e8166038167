# The external packages that the tool and the tests use. A cross build cannot link libraries of the build machine, so it
# builds GoogleTest from Debian's source package and uses the other packages as header-only libraries.

find_package(Threads REQUIRED)
if(NOT CMAKE_CROSSCOMPILING)
    find_package(Boost REQUIRED) # headers alone
    if(FLVDMX_TOOLS)
        find_package(CLI11 REQUIRED)
        find_package(fmt REQUIRED)
        find_package(nlohmann_json REQUIRED)
    endif()
    if(FLVDMX_TESTS)
        find_package(GTest REQUIRED)
    endif()
    return()
endif()

# Uses a folder with only these headers: /usr/include itself would bring the build machine's C library in as well.
function(flvdmx_header_library target folder)
    find_path(include_${folder} ${folder} PATHS /usr/include REQUIRED NO_DEFAULT_PATH NO_CMAKE_FIND_ROOT_PATH)
    file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/headers/${folder})
    file(CREATE_LINK ${include_${folder}}/${folder} ${PROJECT_BINARY_DIR}/headers/${folder}/${folder} SYMBOLIC)
    add_library(${target} INTERFACE IMPORTED GLOBAL)
    target_include_directories(${target} INTERFACE ${PROJECT_BINARY_DIR}/headers/${folder})
endfunction()

flvdmx_header_library(Boost::headers boost)
if(FLVDMX_TOOLS)
    flvdmx_header_library(CLI11::CLI11 CLI)
    flvdmx_header_library(nlohmann_json::nlohmann_json nlohmann)
    flvdmx_header_library(fmt::fmt-header-only fmt)
    target_compile_definitions(fmt::fmt-header-only INTERFACE FMT_HEADER_ONLY=1)
endif()
if(FLVDMX_TESTS)
    set(INSTALL_GTEST OFF CACHE BOOL "GoogleTest is not ours to install")
    add_subdirectory(/usr/src/googletest/googletest ${PROJECT_BINARY_DIR}/googletest EXCLUDE_FROM_ALL)
endif()
