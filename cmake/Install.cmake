# Installs the library, its public headers under include/corvlumex/ with the
# source layout, a pkg-config file and a CMake package config.
include(CMakePackageConfigHelpers)

install(TARGETS fileindex EXPORT fileindexTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/corvlumex)

# The public interface: these headers, and the symbols they declare, are all
# that libfileindex shows (each puts its declarations between
# CORVLUMEX_API_BEGIN and CORVLUMEX_API_END). Every other header is private
# to the tree. A header added here must be self-contained with the others.
set(FILEINDEX_PUBLIC_HEADERS
  common/error.h
  common/export.h
  common/file_util.h
  common/frame.h
  common/frame_reader.h
  common/index_fields.h
  common/json_util.h
  common/lock_file.h
  common/log.h
  common/mutex.h
  common/path_below.h
  common/stop_signals.h
  common/sys.h
  platform/platform.h
  platform/file_ops.h
  sdk/credentials.h
  sdk/sdk_mutex.h
  sdk/share.h
  fileindex/unix_listener.h
  fileindex/elastic/daemon_codes.h
  fileindex/paths/path_rules.h
  fileindex/paths/file_type.h
  fileindex/queue/event.h
  fileindex/queue/optree.h
  fileindex/queue/op_arena.h
  fileindex/queue/op_child_index.h
  fileindex/queue/op_folder_cache.h
  fileindex/queue/op_small_list.h
  fileindex/queue/queue_mgr.h
  fileindex/queue/custom_event.h
  fileindex/state/constants.h
  fileindex/state/folder.h
  fileindex/state/folder_mgr.h
  fileindex/state/status_mgr.h
  fileindex/state/communication.h
  fileindex/elastic/comm.h
  fileindex/elastic/elastic_control.h
  fileindex/elastic/schema.h
  fileindex/mgmt/index_mgr.h
  fileindex/mgmt/related_services.h)
foreach(header ${FILEINDEX_PUBLIC_HEADERS})
  get_filename_component(folder ${header} DIRECTORY)
  install(FILES ${PROJECT_SOURCE_DIR}/${header} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/corvlumex/${folder})
endforeach()

# Public headers that have moved in the tree keep their old installed name:
# a header of that name includes the new one, so code written against an
# earlier libfileindex-dev still compiles.  OLD_NAME=NEW_NAME
set(FILEINDEX_MOVED_HEADERS
  fileindex/communication.h=fileindex/state/communication.h
  fileindex/constants.h=fileindex/state/constants.h
  fileindex/custom_event.h=fileindex/queue/custom_event.h
  fileindex/event.h=fileindex/queue/event.h
  fileindex/file_type.h=fileindex/paths/file_type.h
  fileindex/folder.h=fileindex/state/folder.h
  fileindex/folder_mgr.h=fileindex/state/folder_mgr.h
  fileindex/frame_reader.h=common/frame_reader.h
  fileindex/index_mgr.h=fileindex/mgmt/index_mgr.h
  fileindex/op_arena.h=fileindex/queue/op_arena.h
  fileindex/op_child_index.h=fileindex/queue/op_child_index.h
  fileindex/op_folder_cache.h=fileindex/queue/op_folder_cache.h
  fileindex/op_small_list.h=fileindex/queue/op_small_list.h
  fileindex/optree.h=fileindex/queue/optree.h
  fileindex/queue_mgr.h=fileindex/queue/queue_mgr.h
  fileindex/related_services.h=fileindex/mgmt/related_services.h
  fileindex/status_mgr.h=fileindex/state/status_mgr.h
  fileindex/util.h=fileindex/paths/path_rules.h)
foreach(moved ${FILEINDEX_MOVED_HEADERS})
  string(REPLACE "=" ";" names ${moved})
  list(GET names 0 old_name)
  list(GET names 1 new_name)
  if(NOT new_name IN_LIST FILEINDEX_PUBLIC_HEADERS)
    message(FATAL_ERROR "${old_name} stands for ${new_name}, which is not a public header")
  endif()
  set(forward ${PROJECT_BINARY_DIR}/moved-headers/${old_name})
  file(WRITE ${forward}.new "// Installed under its former name: the header is now ${new_name}.\n#pragma once\n#include \"${new_name}\"\n")
  configure_file(${forward}.new ${forward} COPYONLY)
  get_filename_component(folder ${old_name} DIRECTORY)
  install(FILES ${forward} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/corvlumex/${folder})
endforeach()

install(EXPORT fileindexTargets NAMESPACE fileindex::
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/fileindexConfig.cmake.in
  ${PROJECT_BINARY_DIR}/fileindexConfig.cmake
  INSTALL_DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/fileindexConfig.cmake ${PROJECT_BINARY_DIR}/fileindexConfigVersion.cmake
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/fileindex)

configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in ${PROJECT_BINARY_DIR}/fileindex.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/fileindex.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
