# What `cmake --install` lays down:
#
#   bin/vemo
#   include/vemo/...       the public headers in the tree of the sources; this folder is the include path of the targets,
#                          so that <vemo/store.h> and "store/space.h" both resolve and nothing lies loose in include/
#   lib/libvemo_*
#   lib/cmake/vemo/        find_package(vemo CONFIG COMPONENTS maps store history), one file of targets a component
#   lib/pkgconfig/         vemo-maps.pc, vemo-store.pc, vemo-history.pc
#
# All of it may be moved: no file holds the prefix.
include(CMakePackageConfigHelpers)

set(config_dir ${CMAKE_INSTALL_LIBDIR}/cmake/vemo)

# vemo_install_component(NAME TARGETS...)
function(vemo_install_component name)
  install(TARGETS ${ARGN} EXPORT vemo-${name}
    ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR}
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
  install(EXPORT vemo-${name} NAMESPACE vemo:: FILE vemo-${name}-targets.cmake DESTINATION ${config_dir})
  configure_file(${PROJECT_SOURCE_DIR}/cmake/vemo-${name}.pc.in ${PROJECT_BINARY_DIR}/vemo-${name}.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/vemo-${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()

# The .pc files. Who links the static libraries asks for `pkg-config --static`, as for any library.
file(RELATIVE_PATH VEMO_PC_UP ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
set(VEMO_PC_DEFINITIONS)
if(NOT VEMO_ASSERTIONS)
  set(VEMO_PC_DEFINITIONS " -DVEMO_NO_ASSERTIONS")
endif()
if(BUILD_SHARED_LIBS)
  set(VEMO_PC_STORE_REQUIRES)
  set(VEMO_PC_STORE_PRIVATE)
  set(VEMO_PC_HISTORY_PRIVATE)
  set(engines)
  set(edit_sources)
else()
  set(VEMO_PC_STORE_REQUIRES vemo-maps)
  set(VEMO_PC_STORE_PRIVATE "-lvemo_engines -llmdb")
  set(VEMO_PC_HISTORY_PRIVATE "-lvemo_edit_sources -lsimdjson -lz -luuid")
  set(engines vemo_engines)
  set(edit_sources vemo_edit_sources)
endif()

vemo_install_component(maps vemo_options vemo_maps)
vemo_install_component(store vemo_store ${engines})
if(TARGET vemo_history)
  vemo_install_component(history vemo_history ${edit_sources})
endif()
if(VEMO_BUILD_TOOL)
  if(BUILD_SHARED_LIBS)
    file(RELATIVE_PATH to_libraries ${CMAKE_INSTALL_FULL_BINDIR} ${CMAKE_INSTALL_FULL_LIBDIR})
    set_target_properties(vemo PROPERTIES INSTALL_RPATH "$ORIGIN/${to_libraries}")
    set_target_properties(vemo_history PROPERTIES INSTALL_RPATH "$ORIGIN")
  endif()
  install(TARGETS vemo RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
endif()

vemo_list_public_headers(headers)
foreach(header IN LISTS headers)
  cmake_path(GET header PARENT_PATH folder)
  install(FILES ${header} DESTINATION ${VEMO_INSTALL_INCLUDEDIR}/${folder})
endforeach()

configure_package_config_file(cmake/vemo-config.cmake.in ${PROJECT_BINARY_DIR}/vemo-config.cmake
  INSTALL_DESTINATION ${config_dir} NO_CHECK_REQUIRED_COMPONENTS_MACRO)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/vemo-config-version.cmake COMPATIBILITY SameMinorVersion)
install(FILES ${PROJECT_BINARY_DIR}/vemo-config.cmake ${PROJECT_BINARY_DIR}/vemo-config-version.cmake
              cmake/FindLMDB.cmake cmake/FindLibUUID.cmake
  DESTINATION ${config_dir})
