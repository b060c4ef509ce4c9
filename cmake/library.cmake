# libfileindex.so: the product. Its sources are added by the folders that hold them.
set_target_properties(fileindex PROPERTIES VERSION ${PROJECT_VERSION} SOVERSION
                                           ${PROJECT_VERSION_MAJOR})
target_include_directories(fileindex INTERFACE $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>
                                               $<INSTALL_INTERFACE:include/quivra>)
target_compile_features(fileindex PUBLIC cxx_std_20)
target_link_libraries(fileindex PUBLIC PkgConfig::JSONCPP kesto::interface
                      PRIVATE fileindex_base kestoplatform Threads::Threads)
add_library(quivra::fileindex ALIAS fileindex)
