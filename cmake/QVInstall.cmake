# What is installed, by component:
#   service     the service, its units, users and directories, its manual pages
#   client      the shared library that programs run with
#   client-dev  what programs are built with: headers, pkg-config file, CMake package, manual page
#   tools       control and inspection
#
# packaging/ has the files that are not built; debian/ makes a package of each component.
include(CMakePackageConfigHelpers)

# Where the service manager looks, below the prefix or anywhere.
set(QV_UNIT_DIR lib/systemd/system CACHE STRING "Units of the system")
set(QV_USER_UNIT_DIR lib/systemd/user CACHE STRING "Units of users")
set(QV_SYSUSERS_DIR lib/sysusers.d CACHE STRING "Accounts to make")
set(QV_TMPFILES_DIR lib/tmpfiles.d CACHE STRING "Directories to make")

set(packaging ${PROJECT_SOURCE_DIR}/packaging)
set(made ${PROJECT_BINARY_DIR}/packaging)

# The service.
install(TARGETS quietvoxd COMPONENT service RUNTIME DESTINATION ${CMAKE_INSTALL_LIBEXECDIR})
foreach(manager system user)
  configure_file(${packaging}/systemd/${manager}/quietvox.service.in
                 ${made}/systemd/${manager}/quietvox.service @ONLY)
endforeach()
install(FILES ${packaging}/systemd/system/quietvox.socket ${made}/systemd/system/quietvox.service
        COMPONENT service DESTINATION ${QV_UNIT_DIR})
install(FILES ${packaging}/systemd/user/quietvox.socket ${made}/systemd/user/quietvox.service
        COMPONENT service DESTINATION ${QV_USER_UNIT_DIR})
install(FILES ${packaging}/sysusers.d/quietvox.conf
        COMPONENT service DESTINATION ${QV_SYSUSERS_DIR})
install(FILES ${packaging}/tmpfiles.d/quietvox.conf
        COMPONENT service DESTINATION ${QV_TMPFILES_DIR})
install(FILES ${packaging}/man/quietvoxd.8
        COMPONENT service DESTINATION ${CMAKE_INSTALL_MANDIR}/man8)
install(FILES ${packaging}/man/quietvox.7
        COMPONENT service DESTINATION ${CMAKE_INSTALL_MANDIR}/man7)

# The client library.
install(TARGETS quietvox-client EXPORT QuietVoxClient
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
          COMPONENT client NAMELINK_COMPONENT client-dev
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})

# What programs are built with.
get_target_property(headers quietvox-client QV_PUBLIC_HEADERS)
install(FILES ${headers}
        COMPONENT client-dev DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quietvox)
set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/QuietVoxClient)
install(EXPORT QuietVoxClient NAMESPACE QuietVox:: FILE QuietVoxClientTargets.cmake
        COMPONENT client-dev DESTINATION ${package_dir})
configure_package_config_file(${packaging}/client/QuietVoxClientConfig.cmake.in
  ${made}/QuietVoxClientConfig.cmake INSTALL_DESTINATION ${package_dir}
  NO_SET_AND_CHECK_MACRO NO_CHECK_REQUIRED_COMPONENTS_MACRO)
# The C++ interface may change with the next minor release.
write_basic_package_version_file(${made}/QuietVoxClientConfigVersion.cmake
  COMPATIBILITY SameMinorVersion)
install(FILES ${made}/QuietVoxClientConfig.cmake ${made}/QuietVoxClientConfigVersion.cmake
        COMPONENT client-dev DESTINATION ${package_dir})
configure_file(${packaging}/client/quietvox-client.pc.in ${made}/quietvox-client.pc @ONLY)
install(FILES ${made}/quietvox-client.pc
        COMPONENT client-dev DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
install(FILES ${packaging}/man/libquietvox-client.3
        COMPONENT client-dev DESTINATION ${CMAKE_INSTALL_MANDIR}/man3)

# Tools.
set(qvctl ${PROJECT_SOURCE_DIR}/tools/qvctl)
install(TARGETS qvctl COMPONENT tools RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
install(FILES ${qvctl}/qvctl.1 COMPONENT tools DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)
install(FILES ${qvctl}/completions/qvctl.bash RENAME qvctl
        COMPONENT tools DESTINATION ${CMAKE_INSTALL_DATADIR}/bash-completion/completions)
install(FILES ${qvctl}/completions/_qvctl
        COMPONENT tools DESTINATION ${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions)
