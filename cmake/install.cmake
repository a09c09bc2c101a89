# What "cmake --install" puts under the prefix: the libraries, their headers, what a build needs to
# find them, the companion programs and the manual pages. Nothing in it names the prefix, so the
# installed tree can be moved as a whole.
include(CMakePackageConfigHelpers)

set(cmake_package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/quendel)
set(pkgconfig_dir ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

# The vendor's platform libraries come with the device; the stand-alone ones come with libquendel,
# which then finds the shared one beside itself.
set(libraries quendel quendel_static)
set(platform_libraries ${QUENDEL_PLATFORM_LIBRARIES})
if(NOT QUENDEL_PLATFORM_LIBRARIES)
  set(platform_libraries quendel-platform)
  list(APPEND libraries quendel-platform quendel-platform_static)
  set_target_properties(quendel PROPERTIES INSTALL_RPATH "$ORIGIN")
endif()
install(TARGETS ${libraries} EXPORT quendel-targets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR})
install(DIRECTORY include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} FILES_MATCHING PATTERN "*.h")
if(NOT QUENDEL_PLATFORM_LIBRARIES)
  # In a folder of their own, which is named to the compiler, as they include each other by "platform/".
  set(platform_include_dir ${CMAKE_INSTALL_INCLUDEDIR}/quendel-platform)
  install(DIRECTORY src/platform/ DESTINATION ${platform_include_dir}/platform
    FILES_MATCHING PATTERN "*.h" PATTERN standalone EXCLUDE)
  foreach(library quendel-platform quendel-platform_static)
    target_include_directories(${library} INTERFACE $<INSTALL_INTERFACE:${platform_include_dir}>)
  endforeach()
endif()

install(EXPORT quendel-targets NAMESPACE quendel:: DESTINATION ${cmake_package_dir})
write_basic_package_version_file(quendel-config-version.cmake COMPATIBILITY SameMajorVersion)
install(FILES cmake/quendel-config.cmake ${CMAKE_CURRENT_BINARY_DIR}/quendel-config-version.cmake
  DESTINATION ${cmake_package_dir})

# What a static libquendel leaves to its user to link. The libraries are named one by one, because
# the name of a package would pull in what a static libcurl needs, and libcurl is a shared one here.
set(private_libraries "")
foreach(library IN LISTS platform_libraries)
  # Where a library lies here says nothing about the machine that it is linked on.
  if(library MATCHES "/")
    get_filename_component(library ${library} NAME)
    set(library -l:${library})
  elseif(NOT library MATCHES "^-")
    set(library -l${library})
  endif()
  list(APPEND private_libraries ${library})
endforeach()
list(APPEND private_libraries ${CURL_LDFLAGS} ${CRYPTO_LDFLAGS})
foreach(directory IN LISTS CMAKE_CXX_IMPLICIT_LINK_DIRECTORIES)
  list(REMOVE_ITEM private_libraries -L${directory})
endforeach()
list(JOIN private_libraries " " private_libraries)
file(RELATIVE_PATH prefix_from_pkgconfig /${pkgconfig_dir} /)
string(REGEX REPLACE "/$" "" prefix_from_pkgconfig ${prefix_from_pkgconfig})
configure_file(cmake/quendel.pc.in quendel.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/quendel.pc DESTINATION ${pkgconfig_dir})

if(QUENDEL_BUILD_QUENDELCTL)
  file(RELATIVE_PATH libraries_from_programs /${CMAKE_INSTALL_BINDIR} /${CMAKE_INSTALL_LIBDIR})
  set_target_properties(quendelctl PROPERTIES INSTALL_RPATH "$ORIGIN/${libraries_from_programs}")
  install(TARGETS quendelctl RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
  install(FILES docs/man/quendelctl.1 DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
  install(FILES programs/quendelctl/completions/quendelctl
    DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions)
  install(FILES programs/quendelctl/completions/_quendelctl
    DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/site-functions)
endif()
if(QUENDEL_BUILD_DESK)
  install(TARGETS quendel-desk RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
  install(FILES docs/man/quendel-desk.1 DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
  install(FILES programs/quendel-desk/openapi.json
    DESTINATION ${CMAKE_INSTALL_DATADIR}/quendel-desk)
  install(FILES packaging/systemd/quendel-desk.service DESTINATION lib/systemd/system)
endif()

if(QUENDEL_BUILD_QUENDELD)
  set(worker_dir ${CMAKE_INSTALL_LIBEXECDIR}/quendel)
  file(RELATIVE_PATH libraries_from_worker /${worker_dir} /${CMAKE_INSTALL_LIBDIR})
  set_target_properties(quendel-worker PROPERTIES INSTALL_RPATH "$ORIGIN/${libraries_from_worker}")
  install(TARGETS quendeld RUNTIME DESTINATION ${CMAKE_INSTALL_SBINDIR})
  install(TARGETS quendel-worker RUNTIME DESTINATION ${worker_dir})
  install(FILES docs/man/quendeld.8 DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
  install(FILES docs/man/quendeld.conf.5 DESTINATION ${CMAKE_INSTALL_MANDIR}/man5)
  configure_file(packaging/systemd/quendeld.service.in quendeld.service @ONLY)
  configure_file(packaging/systemd/logrotate-quendel.conf.in logrotate-quendel.conf @ONLY)
  install(FILES ${CMAKE_CURRENT_BINARY_DIR}/quendeld.service DESTINATION lib/systemd/system)
  install(FILES ${CMAKE_CURRENT_BINARY_DIR}/logrotate-quendel.conf
    DESTINATION lib/systemd/system/logrotate.service.d RENAME quendel.conf)
  install(FILES packaging/systemd/quendel.tmpfiles DESTINATION lib/tmpfiles.d RENAME quendel.conf)
  install(FILES packaging/logrotate/firstaction.example
    DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/quendel)
endif()

# The loader looks below /usr by itself. There a search path of one's own only gets in its way.
set(files_with_rpath ${CMAKE_INSTALL_LIBDIR}/libquendel.so.${PROJECT_VERSION}
  ${CMAKE_INSTALL_BINDIR}/quendelctl ${CMAKE_INSTALL_LIBEXECDIR}/quendel/quendel-worker)
install(CODE "
  if(CMAKE_INSTALL_PREFIX MATCHES \"^/usr/*$\")
    foreach(file ${files_with_rpath})
      if(EXISTS \"\$ENV{DESTDIR}/usr/\${file}\")
        file(RPATH_REMOVE FILE \"\$ENV{DESTDIR}/usr/\${file}\")
      endif()
    endforeach()
  endif()")
