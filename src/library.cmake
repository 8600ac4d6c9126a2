# libfileindex.so: every object of the two archives, of which only what is exported can be seen.
file(WRITE ${CMAKE_CURRENT_BINARY_DIR}/empty.cpp.in "")
configure_file(${CMAKE_CURRENT_BINARY_DIR}/empty.cpp.in ${CMAKE_CURRENT_BINARY_DIR}/empty.cpp COPYONLY)
add_library(fileindex SHARED ${CMAKE_CURRENT_BINARY_DIR}/empty.cpp)
set_target_properties(fileindex PROPERTIES VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR})
target_include_directories(fileindex INTERFACE
  $<BUILD_INTERFACE:${CMAKE_CURRENT_SOURCE_DIR}/include>
  $<BUILD_INTERFACE:${CMAKE_CURRENT_SOURCE_DIR}>
  $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}/quarrox>)
target_link_libraries(fileindex
  PRIVATE -Wl,--whole-archive $<TARGET_FILE:common> $<TARGET_FILE:fileindex_core> -Wl,--no-whole-archive
          $<BUILD_INTERFACE:platform_linux>)
target_link_options(fileindex PRIVATE -Wl,--exclude-libs,libplatform_linux.a
  -Wl,--version-script,${CMAKE_CURRENT_SOURCE_DIR}/library.map)
set_property(TARGET fileindex APPEND PROPERTY LINK_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/library.map)
if(NOT FILEINDEX_SANITIZE)
  # A sanitizer's own calls are resolved only in the program.
  target_link_options(fileindex PRIVATE -Wl,--no-undefined)
endif()
add_dependencies(fileindex common fileindex_core vexocontentextract)

# What a user of the library includes: the public headers name jsoncpp and Boost, both found by name.
install(TARGETS fileindex EXPORT fileindexTargets LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
install(DIRECTORY include/common DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quarrox FILES_MATCHING PATTERN "*.h"
        PATTERN "watchdog.h" EXCLUDE)  # of the daemons alone, with a library of its own
install(FILES fileindex/optree.h fileindex/util.h fileindex/folder.h fileindex/folder_mgr.h fileindex/queue_mgr.h
              fileindex/communication.h fileindex/status_mgr.h fileindex/notices.h fileindex/elastic_control.h
              fileindex/custom_events.h fileindex/index_mgr.h fileindex/index_progress.h fileindex/index_failures.h
              fileindex/folder_kinds.h fileindex/index_scope.h fileindex/index_compare.h
              DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quarrox/fileindex)
install(EXPORT fileindexTargets NAMESPACE fileindex:: DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
include(CMakePackageConfigHelpers)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/fileindexConfigVersion.cmake COMPATIBILITY SameMajorVersion)
configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindexConfig.cmake.in ${CMAKE_CURRENT_BINARY_DIR}/fileindexConfig.cmake @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/fileindexConfig.cmake ${CMAKE_CURRENT_BINARY_DIR}/fileindexConfigVersion.cmake
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
# From where the .pc file lies to the prefix, so that the installed tree may be moved.
file(RELATIVE_PATH FILEINDEX_PC_PREFIX ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in ${CMAKE_CURRENT_BINARY_DIR}/fileindex.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/fileindex.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
