# Installation: the framework's shared libraries with their headers and CMake package, the
# commands, the service's module library, the data, and the systemd service that serves the
# robot at boot with its settings in /etc/zefoko/. Components:
#   Runtime      the libraries, zefoko, mokuto, mkbdb, libzumokuto.so, share/zefoko/
#   Development  the headers, the CMake package (find_package(zefoko)), the link names
#   Service      the systemd unit and /etc/zefoko/ (where the system's configuration is:
#                /etc for the prefix /usr, <prefix>/etc for /usr/local)
# A prefix can be moved: run paths, data and the CMake package are found relative to the
# files themselves.

include(CMakePackageConfigHelpers)

set(MOKUTO_INSTALL_CMAKEDIR "${CMAKE_INSTALL_LIBDIR}/cmake/zefoko")
# The module libraries that zefoko serve loads (libzumokuto.so, and a robot's own).
set(MOKUTO_INSTALL_MODULEDIR "${CMAKE_INSTALL_LIBDIR}/zefoko")
set(MOKUTO_INSTALL_DATADIR "${CMAKE_INSTALL_DATADIR}/zefoko")
set(MOKUTO_INSTALL_DOCDIR "${CMAKE_INSTALL_DATADIR}/doc/zefoko")
if(CMAKE_INSTALL_PREFIX STREQUAL "/usr")
  set(systemdUnitDir "/lib/systemd/system")
else()
  set(systemdUnitDir "lib/systemd/system")
endif()
set(MOKUTO_INSTALL_SYSTEMDUNITDIR "${systemdUnitDir}" CACHE STRING
  "Where the systemd unit goes (relative to the prefix, or absolute)")

# The framework's libraries: one major version per incompatible change of their interfaces.
set_target_properties(ko zuvalue zucommon PROPERTIES
  VERSION "${PROJECT_VERSION}" SOVERSION "${PROJECT_VERSION_MAJOR}")
set_target_properties(mokutomodule PROPERTIES EXPORT_NAME zumokuto)

# Run paths relative to each file, none where the libraries land in a directory that the
# dynamic linker searches anyway.
if(NOT "${CMAKE_INSTALL_FULL_LIBDIR}" IN_LIST CMAKE_CXX_IMPLICIT_LINK_DIRECTORIES)
  file(RELATIVE_PATH binaryToLibrary "${CMAKE_INSTALL_FULL_BINDIR}" "${CMAKE_INSTALL_FULL_LIBDIR}")
  set_target_properties(zefoko mokuto mkbdb PROPERTIES INSTALL_RPATH "$ORIGIN/${binaryToLibrary}")
  set_target_properties(ko zuvalue zucommon PROPERTIES INSTALL_RPATH "$ORIGIN")
  set_target_properties(mokutomodule PROPERTIES INSTALL_RPATH "$ORIGIN/..")
endif()

install(TARGETS ko zuvalue zucommon EXPORT zefokoTargets
  LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT Runtime NAMELINK_COMPONENT Development)
install(TARGETS zefoko mokuto mkbdb EXPORT zefokoTargets
  RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}" COMPONENT Runtime)
install(TARGETS mokutomodule EXPORT zefokoTargets
  LIBRARY DESTINATION "${MOKUTO_INSTALL_MODULEDIR}" COMPONENT Runtime)
install(DIRECTORY libko/include/ libzuvalue/include/ libzucommon/include/
  DESTINATION "${MOKUTO_INSTALL_INCLUDEDIR}" COMPONENT Development)

# The package: zefoko::ko, zefoko::zuvalue, zefoko::zucommon, and the commands and the
# service's module as imported targets (zefoko::zefoko, zefoko::mokuto, zefoko::mkbdb,
# zefoko::zumokuto).
install(EXPORT zefokoTargets NAMESPACE zefoko::
  DESTINATION "${MOKUTO_INSTALL_CMAKEDIR}" COMPONENT Development)
configure_package_config_file(cmake/zefokoConfig.cmake.in
  "${CMAKE_CURRENT_BINARY_DIR}/zefokoConfig.cmake"
  INSTALL_DESTINATION "${MOKUTO_INSTALL_CMAKEDIR}"
  PATH_VARS MOKUTO_INSTALL_MODULEDIR MOKUTO_INSTALL_DATADIR)
write_basic_package_version_file("${CMAKE_CURRENT_BINARY_DIR}/zefokoConfigVersion.cmake"
  COMPATIBILITY SameMajorVersion)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/zefokoConfig.cmake"
              "${CMAKE_CURRENT_BINARY_DIR}/zefokoConfigVersion.cmake"
  DESTINATION "${MOKUTO_INSTALL_CMAKEDIR}" COMPONENT Development)

# The data: the starter animations and sounds, and the linguistic databases with the
# licences of their sources.
install(DIRECTORY share/zefoko/ DESTINATION "${MOKUTO_INSTALL_DATADIR}" COMPONENT Runtime)
if(TARGET lingdata)
  install(DIRECTORY "${MOKUTO_GENERATED_SHARE_DIR}/zefoko/"
    DESTINATION "${MOKUTO_INSTALL_DATADIR}" COMPONENT Runtime)
  # Lefff's licence asks that whoever ships a work based on it ships its legible form too:
  # the lexicons that the two French databases are built from.
  set(lexiconWork "${CMAKE_BINARY_DIR}/tools/lexicons")
  set(legible "${CMAKE_BINARY_DIR}/legible-lexicons")
  set(legibleFiles "")
  foreach(name french.lex french.freq frenchemotions.lex)
    add_custom_command(OUTPUT "${legible}/${name}.gz"
      COMMAND ${CMAKE_COMMAND} -E make_directory "${legible}"
      COMMAND gzip -9nc "${lexiconWork}/${name}" > "${legible}/${name}.gz"
      DEPENDS lingdata "${lexiconWork}/${name}"
      COMMENT "Compressing the legible form ${name}")
    list(APPEND legibleFiles "${legible}/${name}.gz")
  endforeach()
  add_custom_target(legible_lexicons ALL DEPENDS ${legibleFiles})
  install(FILES ${legibleFiles}
    DESTINATION "${MOKUTO_INSTALL_DATADIR}/mokuto/syntacticanalysis/sources" COMPONENT Runtime)
endif()
install(FILES README.md DESTINATION "${MOKUTO_INSTALL_DOCDIR}" COMPONENT Runtime)

# The Python client (import zefoko), where Debian's python3 finds it for the prefix /usr.
set(MOKUTO_INSTALL_PYTHONDIR "lib/python3/dist-packages" CACHE STRING
  "Where the Python client goes, relative to the prefix")
install(DIRECTORY python/zefoko DESTINATION "${MOKUTO_INSTALL_PYTHONDIR}" COMPONENT Runtime
  FILES_MATCHING PATTERN "*.py")

# The service: zefoko serve at boot, listening on the endpoint of /etc/zefoko/serve.conf.
configure_file(packaging/zefoko.service.in "${CMAKE_CURRENT_BINARY_DIR}/packaging/zefoko.service" @ONLY)
configure_file(packaging/serve.conf.in "${CMAKE_CURRENT_BINARY_DIR}/packaging/serve.conf" @ONLY)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/packaging/zefoko.service"
  DESTINATION "${MOKUTO_INSTALL_SYSTEMDUNITDIR}" COMPONENT Service)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/packaging/serve.conf"
  DESTINATION "${CMAKE_INSTALL_FULL_SYSCONFDIR}/zefoko" COMPONENT Service)

include(cmake/package.cmake)

# The installation in use, out of reach of the source and build trees: installed into a
# temporary prefix, examples/hello-module built against it, zefoko serve with the module
# and libzumokuto.so, mokuto and the Python client calling them. The sanitizers' builds
# would need their runtimes in the module's project: the plain build alone, with the
# linguistic databases that the text's automatic gesture needs.
if(MOKUTO_BUILD_TESTS AND MOKUTO_SANITIZE STREQUAL "" AND TARGET lingdata)
  add_test(NAME install_hello_module
    COMMAND bash "${CMAKE_CURRENT_SOURCE_DIR}/packaging/install_test.sh"
            "${CMAKE_CURRENT_SOURCE_DIR}" "${CMAKE_BINARY_DIR}" "${CMAKE_CXX_COMPILER_LAUNCHER}")
  set_tests_properties(install_hello_module PROPERTIES
    LABELS "slow;install" TIMEOUT 300 PASS_REGULAR_EXPRESSION "install test: passed"
    SKIP_REGULAR_EXPRESSION "install test: skipped")
endif()
