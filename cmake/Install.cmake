# Installs four components: runtime, development, tools and gstreamer. Installed files refer to each other by relative
# paths, so that an installed tree can be moved.

# On Debian, libraries go into the architecture's folder, also in cross builds and below every prefix.
if(EXISTS /etc/debian_version AND CMAKE_LIBRARY_ARCHITECTURE)
    set(CMAKE_INSTALL_LIBDIR lib/${CMAKE_LIBRARY_ARCHITECTURE} CACHE PATH "Libraries, below the prefix")
endif()
include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/flvdmx)
install(TARGETS flvdmx EXPORT flvdmx
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT runtime NAMELINK_COMPONENT development
    INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(TARGETS flvdmx-host EXPORT flvdmx
    ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development
    INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(FILES ${PROJECT_SOURCE_DIR}/flvdmx/flvdmx.h ${PROJECT_SOURCE_DIR}/flvdmx/layers.h
    DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/flvdmx COMPONENT development)
install(DIRECTORY ${PROJECT_SOURCE_DIR}/host/include/flvdmx
    DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT development)

install(EXPORT flvdmx NAMESPACE flvdmx:: FILE flvdmxTargets.cmake DESTINATION ${package_dir} COMPONENT development)
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/flvdmxConfig.cmake.in ${PROJECT_BINARY_DIR}/flvdmxConfig.cmake
    INSTALL_DESTINATION ${package_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/flvdmxConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/flvdmxConfig.cmake ${PROJECT_BINARY_DIR}/flvdmxConfigVersion.cmake
    DESTINATION ${package_dir} COMPONENT development)

file(RELATIVE_PATH FLVDMX_PREFIX_FROM_PC /${CMAKE_INSTALL_LIBDIR}/pkgconfig /)
string(REGEX REPLACE "/$" "" FLVDMX_PREFIX_FROM_PC "${FLVDMX_PREFIX_FROM_PC}")
foreach(name IN ITEMS flvdmx flvdmx-host)
    configure_file(${PROJECT_SOURCE_DIR}/packaging/${name}.pc.in ${PROJECT_BINARY_DIR}/${name}.pc @ONLY)
    install(FILES ${PROJECT_BINARY_DIR}/${name}.pc
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
endforeach()

# What authors of a host read and copy. The folders are arranged as in the source tree, so that links and includes work.
set(doc_dir ${CMAKE_INSTALL_DATADIR}/doc/flvdmx)
install(FILES ${PROJECT_SOURCE_DIR}/docs/host-guide.md ${PROJECT_SOURCE_DIR}/docs/damage.md
    DESTINATION ${doc_dir}/docs COMPONENT development)
install(DIRECTORY ${PROJECT_SOURCE_DIR}/examples ${PROJECT_SOURCE_DIR}/host DESTINATION ${doc_dir} COMPONENT development
    FILES_MATCHING PATTERN "*.c" PATTERN "*.cpp" PATTERN "*.h" PATTERN "host/include" EXCLUDE)

file(MAKE_DIRECTORY ${PROJECT_BINARY_DIR}/man)
# flvdmx_install_man(PAGE COMPONENT): compresses the page without a timestamp, so that builds are reproducible.
function(flvdmx_install_man page component)
    set(source ${PROJECT_SOURCE_DIR}/docs/man/${page})
    set_property(DIRECTORY ${PROJECT_SOURCE_DIR} APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${source})
    execute_process(COMMAND gzip -9nc ${source} OUTPUT_FILE ${PROJECT_BINARY_DIR}/man/${page}.gz
        COMMAND_ERROR_IS_FATAL ANY)
    string(REGEX REPLACE ".*\\." "" section ${page})
    install(FILES ${PROJECT_BINARY_DIR}/man/${page}.gz
        DESTINATION ${CMAKE_INSTALL_MANDIR}/man${section} COMPONENT ${component})
endfunction()

# flvdmx_install_user(TARGET FOLDER COMPONENT): installs a program or plugin that finds the library by a relative path.
# Below the system's own prefix the loader finds it without a run path.
function(flvdmx_install_user target folder component)
    file(RELATIVE_PATH lib_from_folder /${folder} /${CMAKE_INSTALL_LIBDIR})
    set_target_properties(${target} PROPERTIES INSTALL_RPATH "$ORIGIN/${lib_from_folder}")
    install(TARGETS ${target} RUNTIME DESTINATION ${folder} COMPONENT ${component}
        LIBRARY DESTINATION ${folder} COMPONENT ${component})
    install(CODE "if(CMAKE_INSTALL_PREFIX STREQUAL \"/usr\")
        file(RPATH_REMOVE FILE \"\$ENV{DESTDIR}/usr/${folder}/$<TARGET_FILE_NAME:${target}>\")
    endif()" COMPONENT ${component})
endfunction()

flvdmx_install_man(QVX_FLV_DMX.3 development)
if(FLVDMX_GSTREAMER)
    flvdmx_install_user(gstflvdmx ${CMAKE_INSTALL_LIBDIR}/gstreamer-1.0 gstreamer)
endif()
if(FLVDMX_TOOLS)
    flvdmx_install_user(flvdmx-tool ${CMAKE_INSTALL_BINDIR} tools)
    flvdmx_install_man(flvdmx.1 tools)
    install(FILES ${PROJECT_SOURCE_DIR}/packaging/flvdmx.bash RENAME flvdmx
        DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions COMPONENT tools)
endif()
