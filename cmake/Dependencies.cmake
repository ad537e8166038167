# The external packages that the tool, the tests and the GStreamer plugin use. A cross build cannot link libraries of the
# build machine: it builds GoogleTest from Debian's source package, takes GStreamer from a folder, and uses the other
# packages as header-only libraries.

set(FLVDMX_GSTREAMER_ROOT "" CACHE PATH "Cross build: root folder of GStreamer's development files for the target")

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
    if(FLVDMX_GSTREAMER)
        find_package(PkgConfig REQUIRED)
        pkg_check_modules(gstreamer REQUIRED IMPORTED_TARGET GLOBAL gstreamer-1.0>=1.22 gstreamer-base-1.0
            gstreamer-pbutils-1.0 gstreamer-video-1.0)
        add_library(flvdmx::gstreamer ALIAS PkgConfig::gstreamer)
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
if(FLVDMX_GSTREAMER)
    set(libraries ${FLVDMX_GSTREAMER_ROOT}/usr/lib/${CMAKE_LIBRARY_ARCHITECTURE})
    add_library(flvdmx::gstreamer INTERFACE IMPORTED GLOBAL)
    target_include_directories(flvdmx::gstreamer INTERFACE ${FLVDMX_GSTREAMER_ROOT}/usr/include/gstreamer-1.0
        ${FLVDMX_GSTREAMER_ROOT}/usr/include/glib-2.0 ${libraries}/glib-2.0/include)
    foreach(name IN ITEMS gstbase-1.0 gstpbutils-1.0 gstvideo-1.0 gstreamer-1.0 gobject-2.0 glib-2.0)
        target_link_libraries(flvdmx::gstreamer INTERFACE ${libraries}/lib${name}.so)
    endforeach()
endif()
