# What "cmake --install" lays down, in three components: the library, what is needed to build
# against it, and the programs. Everything goes below the prefix; nothing is configuration.
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

# The prefix is told from where the file lies, so that an installed tree can be moved. The way up
# depends on the library directory: lib, lib64, lib/x86_64-linux-gnu.
file(RELATIVE_PATH FILEINDEX_PC_UP /p/${CMAKE_INSTALL_LIBDIR}/pkgconfig /p)
string(REGEX REPLACE "/$" "" FILEINDEX_PC_UP "${FILEINDEX_PC_UP}")
configure_file(cmake/quivra-fileindex.pc.in ${PROJECT_BINARY_DIR}/quivra-fileindex.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/quivra-fileindex.pc
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)

install(TARGETS fileindexd kestoelasticd kestotifyd
        RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR} COMPONENT programs)
install(TARGETS fileindexctl RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT programs)
# The library runs it by its full path, /usr/kesto/bin/kestokosnotify.
install(TARGETS kestokosnotify RUNTIME DESTINATION kesto/bin COMPONENT programs)
# Outside of the loader's own directories, what is installed finds its libraries by its own place.
file(RELATIVE_PATH up_from_programs /p/${CMAKE_INSTALL_SBINDIR} /p/${CMAKE_INSTALL_LIBDIR})
set_target_properties(fileindexd kestoelasticd kestotifyd fileindexctl PROPERTIES
                      INSTALL_RPATH "$ORIGIN/${up_from_programs}")
set_target_properties(kestokosnotify PROPERTIES
                      INSTALL_RPATH "$ORIGIN/../../${CMAKE_INSTALL_LIBDIR}")
set_target_properties(fileindex PROPERTIES INSTALL_RPATH "$ORIGIN")
add_subdirectory(packaging)
