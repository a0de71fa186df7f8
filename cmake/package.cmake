# The Debian packages, made by CPack from the install components (cpack --preset package):
#   zefoko      the commands, the framework's libraries, libzumokuto.so, the data and the
#               service (components Runtime and Service)
#   zefoko-dev  the headers and the CMake package, to build module libraries of one's own
# Dependencies come from the shared libraries through dpkg-shlibdeps, plus the data that the
# programs read at run time.

set(MOKUTO_PACKAGE_MAINTAINER "mokuto maintainers <maintainers@example.org>" CACHE STRING
  "The Maintainer of the Debian packages")
set(MOKUTO_PACKAGE_REVISION "1" CACHE STRING "The Debian revision of the packages")
set(debianVersion "${PROJECT_VERSION}-${MOKUTO_PACKAGE_REVISION}")

# What every package carries in /usr/share/doc/<package>/: the copyright of the software and
# of the data, and a changelog dated by SOURCE_DATE_EPOCH when it is set.
string(TIMESTAMP MOKUTO_PACKAGE_DATE "%a, %d %b %Y %H:%M:%S +0000" UTC)
set(MOKUTO_PACKAGE_VERSION "${debianVersion}")
set(packaging "${CMAKE_CURRENT_BINARY_DIR}/packaging")
foreach(package zefoko zefoko-dev)
  set(MOKUTO_PACKAGE_NAME "${package}")
  configure_file(packaging/changelog.in "${packaging}/${package}/changelog.Debian" @ONLY)
  add_custom_command(OUTPUT "${packaging}/${package}/changelog.Debian.gz"
    COMMAND gzip -9nkf "${packaging}/${package}/changelog.Debian"
    DEPENDS "${packaging}/${package}/changelog.Debian")
  list(APPEND changelogs "${packaging}/${package}/changelog.Debian.gz")
endforeach()
add_custom_target(package_changelogs ALL DEPENDS ${changelogs})

# The commands' manual pages, made by help2man from their --help (the package preset only:
# the commands run during the build).
option(MOKUTO_MAN_PAGES "Make the commands' manual pages with help2man" OFF)
if(MOKUTO_MAN_PAGES)
  find_program(MOKUTO_HELP2MAN help2man REQUIRED)
  set(whatis_zefoko "the simulated robot, the host of module libraries, and its tools")
  set(whatis_mokuto "speak annotated texts with the speech-animation service, and inspect it")
  set(whatis_mkbdb "build a linguistic database file from plain lexicons")
  set(manPages "")
  foreach(command zefoko mokuto mkbdb)
    set(page "${packaging}/man/${command}.1")
    add_custom_command(OUTPUT "${page}.gz"
      COMMAND ${CMAKE_COMMAND} -E make_directory "${packaging}/man"
      COMMAND "${MOKUTO_HELP2MAN}" --no-info --no-discard-stderr
              --version-string "${PROJECT_VERSION}" --name "${whatis_${command}}"
              --include "${CMAKE_CURRENT_SOURCE_DIR}/packaging/man.h2m"
              --output "${page}" "$<TARGET_FILE:${command}>"
      COMMAND gzip -9nf "${page}"
      DEPENDS ${command} packaging/man.h2m
      COMMENT "Manual page of ${command}")
    list(APPEND manPages "${page}.gz")
  endforeach()
  add_custom_target(man_pages ALL DEPENDS ${manPages})
  install(FILES ${manPages} DESTINATION "${CMAKE_INSTALL_MANDIR}/man1" COMPONENT Runtime)
endif()
install(FILES packaging/copyright "${packaging}/zefoko/changelog.Debian.gz"
  DESTINATION "${CMAKE_INSTALL_DATADIR}/doc/zefoko" COMPONENT Runtime)
install(FILES packaging/copyright "${packaging}/zefoko-dev/changelog.Debian.gz"
  DESTINATION "${CMAKE_INSTALL_DATADIR}/doc/zefoko-dev" COMPONENT Development)

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME zefoko)
set(CPACK_PACKAGE_VERSION "${PROJECT_VERSION}")
set(CPACK_PACKAGE_CONTACT "${MOKUTO_PACKAGE_MAINTAINER}")
set(CPACK_PACKAGING_INSTALL_PREFIX "${CMAKE_INSTALL_PREFIX}")
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL Runtime Service Development)
set(CPACK_COMPONENTS_GROUPING ONE_PER_GROUP)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_VERSION "${PROJECT_VERSION}")
set(CPACK_DEBIAN_PACKAGE_RELEASE "${MOKUTO_PACKAGE_REVISION}")
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
# The shlibs file of the framework's libraries, for the packages built against them. CPack
# warns that libzumokuto.so has no soname: a module library, loaded by path, needs none.
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")

set(CPACK_DEBIAN_ZEFOKO_PACKAGE_NAME zefoko)
set(CPACK_DEBIAN_ZEFOKO_PACKAGE_SECTION misc)
set(CPACK_DEBIAN_ZEFOKO_PACKAGE_SHLIBDEPS ON)
# MeCab's dictionary, which the speech reads Japanese texts with.
set(CPACK_DEBIAN_ZEFOKO_PACKAGE_DEPENDS "mecab-ipadic-utf8")
# The Python client's interpreter, sockets and values.
set(CPACK_DEBIAN_ZEFOKO_PACKAGE_RECOMMENDS "python3, python3-zmq, python3-msgpack")
set(CPACK_DEBIAN_ZEFOKO_DESCRIPTION
"speech animation for a humanoid robot, with its framework and a simulated robot
The service ZUMokuto makes a humanoid robot speak with its body: it
speaks texts annotated with instructions (start, wait for or stop an
animation, play a sound, call a service, set a memory key) and runs each
action when the speech reaches it, adding gestures chosen from the words
where the caller wrote none.

This package holds the framework's libraries, the host zefoko (which
serves a simulated robot and module libraries to other processes, also
as the systemd service zefoko), the command mokuto, the module library
of the service, the starter animations and sounds, and the linguistic
databases for English, French and Japanese.")
# The maintainer scripts stop, restart and disable the service (it is never enabled for the
# administrator), and the trigger runs ldconfig for the libraries.
file(WRITE "${packaging}/debian/conffiles" "${CMAKE_INSTALL_FULL_SYSCONFDIR}/zefoko/serve.conf\n")
set(debian "${CMAKE_CURRENT_SOURCE_DIR}/packaging/debian")
set(CPACK_DEBIAN_ZEFOKO_PACKAGE_CONTROL_EXTRA "${packaging}/debian/conffiles;${debian}/postinst;${debian}/prerm;${debian}/postrm;${debian}/triggers")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME zefoko-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS
  "zefoko (= ${debianVersion}), libboost-dev (>= 1.74), nlohmann-json3-dev (>= 3.10)")
set(CPACK_DEBIAN_DEV_PACKAGE_RECOMMENDS "cmake (>= 3.25), g++ (>= 4:12)")
set(CPACK_DEBIAN_DEV_DESCRIPTION
"speech animation for a humanoid robot: headers and CMake package
The headers of the framework's libraries (ko, zuvalue, zucommon) and the
CMake package zefoko, with which a project builds module libraries of
its own: find_package(zefoko), then link zefoko::zucommon. zefoko serve
loads them beside the speech-animation service.")

include(CPack)
cpack_add_component_group(zefoko)
cpack_add_component_group(dev)
cpack_add_component(Runtime GROUP zefoko)
cpack_add_component(Service GROUP zefoko)
cpack_add_component(Development GROUP dev)
