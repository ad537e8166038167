# Debian packages, built by CPack, one per component: libflvdmx1, libflvdmx-dev, flvdmx-tools, gstreamer1.0-flvdmx.

set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL runtime development)
if(FLVDMX_TOOLS)
    list(APPEND CPACK_COMPONENTS_ALL tools)
endif()
if(FLVDMX_GSTREAMER)
    list(APPEND CPACK_COMPONENTS_ALL gstreamer)
endif()
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "") # would be printed above the summary of every package
set(CPACK_PACKAGE_VENDOR "the flvdmx authors")
set(CPACK_PACKAGE_CONTACT "the flvdmx authors")
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_LIBRARY_OUTPUT_DIRECTORY})
get_target_property(abi flvdmx SOVERSION)
set(version ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})

# flvdmx_package(COMPONENT NAME SECTION MULTIARCH SUMMARY DESCRIPTION): sets a package's control fields and installs its
# licence. CPack has no variable for the Multi-Arch field before 3.31, so it is set as a second line of the section.
macro(flvdmx_package component name section multiarch summary description)
    string(TOUPPER ${component} key)
    set(CPACK_DEBIAN_${key}_PACKAGE_NAME ${name})
    set(CPACK_DEBIAN_${key}_PACKAGE_SECTION "${section}\nMulti-Arch: ${multiarch}")
    set(CPACK_DEBIAN_${key}_DESCRIPTION "${summary}\n${description}")
    install(FILES ${PROJECT_SOURCE_DIR}/LICENSE RENAME copyright
        DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/${name} COMPONENT ${component})
    install(FILES ${PROJECT_SOURCE_DIR}/NEWS.md
        DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/${name} COMPONENT ${component})
endmacro()

flvdmx_package(runtime libflvdmx${abi} libs same "demultiplexer for the FLV container"
    "Finds the audio and video streams of an FLV file, their codec configuration\nand the metadata, and delivers \
one frame per call. Plays files that are still\nbeing written and survives damage. Uses only the memory and \
file functions\nthat the program supplies.")
flvdmx_package(development libflvdmx-dev libdevel same "demultiplexer for the FLV container (development files)"
    "Headers for C and C++, the host kit with ready-made file functions, and the\nfiles for pkg-config and CMake.")
if(FLVDMX_TOOLS)
    flvdmx_package(tools flvdmx-tools video foreign "inspects, checks and demultiplexes FLV files"
        "The program flvdmx lists streams and frames, seeks, extracts elementary\nstreams, checks files for damage and \
draws their bit rate.")
endif()
if(FLVDMX_GSTREAMER)
    flvdmx_package(gstreamer gstreamer1.0-flvdmx libs same "FLV demultiplexer for GStreamer"
        "The element flvdmxdemux plays FLV files, also damaged ones, from sources that\ncan be read at any position. \
Players take it when it is preferred:\nGST_PLUGIN_FEATURE_RANK=flvdmxdemux:MAX.")
endif()

set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/packaging/triggers)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libflvdmx${abi} (= ${version})")
set(CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS "libflvdmx${abi} (>= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_GSTREAMER_PACKAGE_DEPENDS ${CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS})
if(CMAKE_CROSSCOMPILING)
    # The cross compiler's libraries belong to packages that do not exist on the target, so the dependencies cannot be
    # derived from them. These are the target's packages in Debian 12.
    set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE armhf)
    set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS "libc6 (>= 2.36)")
    set(cxx_runtime "libc6 (>= 2.36), libgcc-s1, libstdc++6 (>= 12)")
    string(APPEND CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS ", ${cxx_runtime}")
    string(APPEND CPACK_DEBIAN_GSTREAMER_PACKAGE_DEPENDS ", ${cxx_runtime}, libglib2.0-0 (>= 2.74), \
libgstreamer1.0-0 (>= 1.22), libgstreamer-plugins-base1.0-0 (>= 1.22)")
else()
    set(CPACK_DEBIAN_RUNTIME_PACKAGE_SHLIBDEPS ON)
    set(CPACK_DEBIAN_TOOLS_PACKAGE_SHLIBDEPS ON)
    set(CPACK_DEBIAN_GSTREAMER_PACKAGE_SHLIBDEPS ON)
endif()
include(CPack)
