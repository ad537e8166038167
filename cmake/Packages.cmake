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
set(FLVDMX_PACKAGE_CONTACT "the flvdmx authors <maintainers@flvdmx.example>" CACHE STRING
    "Maintainer field of the packages: a name and an address for reports")
set(CPACK_PACKAGE_CONTACT ${FLVDMX_PACKAGE_CONTACT})
set(CPACK_DEBIAN_PACKAGE_SOURCE flvdmx)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_LIBRARY_OUTPUT_DIRECTORY})
get_target_property(abi flvdmx SOVERSION)
set(version ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})

# Debian wants the licence in a format for programs, and its own changelog compressed, without a timestamp so that builds
# are reproducible.
file(READ ${PROJECT_SOURCE_DIR}/LICENSE license)
string(REGEX REPLACE "^[^\n]*\n\n[^\n]*\n\n" "" license "${license}") # the title and the copyright line
string(REGEX REPLACE "\n$" "" license " ${license}")
string(REPLACE "\n" "\n " license "${license}")
string(REPLACE "\n \n" "\n .\n" license "${license}")
configure_file(${PROJECT_SOURCE_DIR}/packaging/copyright.in ${PROJECT_BINARY_DIR}/debian/copyright @ONLY)
set(changelog ${PROJECT_SOURCE_DIR}/packaging/changelog)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${changelog})
file(STRINGS ${changelog} newest LIMIT_COUNT 1)
if(NOT newest MATCHES "^flvdmx \\(${version}\\) ")
    message(FATAL_ERROR "packaging/changelog must begin with release ${version}")
endif()
execute_process(COMMAND gzip -9nc ${changelog} OUTPUT_FILE ${PROJECT_BINARY_DIR}/debian/changelog.Debian.gz
    COMMAND_ERROR_IS_FATAL ANY)

# flvdmx_package(COMPONENT NAME SECTION MULTIARCH SUMMARY DESCRIPTION): sets a package's control fields and installs the
# documents that every package has. CPack has no variable for the Multi-Arch field before 3.31, so it is set as a second line of the section.
macro(flvdmx_package component name section multiarch summary description)
    string(TOUPPER ${component} key)
    set(CPACK_DEBIAN_${key}_PACKAGE_NAME ${name})
    set(CPACK_DEBIAN_${key}_PACKAGE_SECTION "${section}\nMulti-Arch: ${multiarch}")
    set(CPACK_DEBIAN_${key}_DESCRIPTION "${summary}\n${description}")
    install(FILES ${PROJECT_BINARY_DIR}/debian/copyright ${PROJECT_BINARY_DIR}/debian/changelog.Debian.gz
        ${PROJECT_SOURCE_DIR}/NEWS.md DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/${name} COMPONENT ${component})
endmacro()

flvdmx_package(runtime libflvdmx${abi} libs same "demultiplexer for the FLV container"
    "Finds the audio and video streams of an FLV file, their codec configuration\nand the metadata, and delivers \
one frame per call. Plays files that are still\nbeing written and survives damage. Uses only the memory and \
file functions\nthat the program supplies.")
flvdmx_package(development libflvdmx-dev libdevel same "demultiplexer for the FLV container (development files)"
    "Headers for C and C++, the host kit with ready-made file functions, and the\nfiles for pkg-config and CMake.")
if(FLVDMX_TOOLS)
    flvdmx_package(tools flvdmx-tools video foreign "inspects, checks and demultiplexes FLV files"
        "The program flvdmx lists streams and frames, seeks, extracts elementary\nstreams, checks files for damage, \
draws their bit rate,\nrepairs and cuts recordings, and adds keyframe indexes.")
endif()
if(FLVDMX_GSTREAMER)
    flvdmx_package(gstreamer gstreamer1.0-flvdmx libs same "FLV demultiplexer for GStreamer"
        "The element flvdmxdemux plays FLV files, damaged ones included, from sources\nthat support random access. \
To make players prefer it, set\nGST_PLUGIN_FEATURE_RANK=flvdmxdemux:MAX.")
endif()

# CPack would write the shlibs file and find the dependencies of the library itself, but then it also adds scripts that
# call ldconfig, although the trigger does that already. The library calls a few functions of the C library only.
file(WRITE ${PROJECT_BINARY_DIR}/debian/shlibs "libflvdmx ${abi} libflvdmx${abi} (>= ${PROJECT_VERSION})\n")
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/packaging/triggers
    ${PROJECT_BINARY_DIR}/debian/shlibs)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS "libc6 (>= 2.14)")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libflvdmx${abi} (= ${version})")
set(CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS "libflvdmx${abi} (>= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_GSTREAMER_PACKAGE_DEPENDS ${CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS})
if(CMAKE_CROSSCOMPILING)
    # The cross compiler's libraries belong to packages that do not exist on the target, so the dependencies cannot be
    # derived from them. These are the target's packages in Debian 12.
    set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE armhf)
    set(cxx_runtime "libc6 (>= 2.36), libgcc-s1, libstdc++6 (>= 12)")
    string(APPEND CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS ", ${cxx_runtime}")
    string(APPEND CPACK_DEBIAN_GSTREAMER_PACKAGE_DEPENDS ", ${cxx_runtime}, libglib2.0-0 (>= 2.74), \
libgstreamer1.0-0 (>= 1.22), libgstreamer-plugins-base1.0-0 (>= 1.22)")
else()
    set(CPACK_DEBIAN_TOOLS_PACKAGE_SHLIBDEPS ON)
    set(CPACK_DEBIAN_GSTREAMER_PACKAGE_SHLIBDEPS ON)
endif()
include(CPack)
