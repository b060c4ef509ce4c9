# What "cmake --install" lays down, in three components: the library, what is needed to build
# against it, and the programs.
include(CMakePackageConfigHelpers)

set(FILEINDEX_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/quivra-fileindex)

install(TARGETS fileindex kestoplatform kesto_interface EXPORT quivra-fileindex-targets
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library
                NAMELINK_COMPONENT development)

# Headers keep their place in the tree, since they include each other by it.
set(public_headers
    common/error.h common/export.h common/json.h common/lock_file.h common/log.h common/mutex.h
    common/util.h
    fileindex/event.h fileindex/op.h fileindex/optree.h fileindex/queue_mgr.h
    fileindex/communication.h fileindex/folder.h fileindex/folder_mgr.h fileindex/status_mgr.h
    fileindex/util.h fileindex/file_types.h fileindex/path_rules.h fileindex/index_mgr.h
    fileindex/elastic/elastic_control.h fileindex/elastic/protocol.h
    sdk/share.h sdk/credentials.h)
foreach(header ${public_headers})
    get_filename_component(folder ${header} DIRECTORY)
    install(FILES ${header} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quivra/${folder}
            COMPONENT development)
endforeach()
install(DIRECTORY platform/kesto DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quivra
        COMPONENT development)

install(EXPORT quivra-fileindex-targets NAMESPACE quivra:: DESTINATION ${FILEINDEX_CMAKE_DIR}
        COMPONENT development)
configure_package_config_file(cmake/quivra-fileindex-config.cmake.in
    ${PROJECT_BINARY_DIR}/quivra-fileindex-config.cmake INSTALL_DESTINATION ${FILEINDEX_CMAKE_DIR})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/quivra-fileindex-config-version.cmake
    COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/quivra-fileindex-config.cmake
              ${PROJECT_BINARY_DIR}/quivra-fileindex-config-version.cmake
        DESTINATION ${FILEINDEX_CMAKE_DIR} COMPONENT development)
configure_file(cmake/quivra-fileindex.pc.in ${PROJECT_BINARY_DIR}/quivra-fileindex.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/quivra-fileindex.pc
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
