# The Debian packages, built with CPack (scripts/package.sh; docs/packaging.md):
#   hoxcm      the library, hoxcfg, the runners at the host's fixed paths, the
#              manifest schemas, the sample host, the systemd units, man pages
#              and bash completion, the directories of the host's state;
#   hoxcm-dev  headers, the CMake package, hoxcm.pc and the library's link name.
# Both are built from an installation below the prefix /usr.

# The directory of the host's state, owned by the package with its mode:
# the store holds the host's configuration (secrets included), so it is
# root's only. Absolute: it does not move with the prefix.
# The lifecycle directory (/var/tarvik/lifecycle: requests and results of
# plugin runs) is not a directory Debian lets a package own below /var; the
# postinst script creates it.
set(HOXCM_PACKAGE_STATE_DIRS /var/lib/tarvik/configstore)
# Directories that other packages fill: the host's key schemas and plugins.
set(HOXCM_PACKAGE_SHARED_DIRS lib/tarvik/configmanager/schemas lib/tarvik/configmanager/apply_modules)

if(CMAKE_INSTALL_PREFIX STREQUAL "/usr")
  set(empty_dir "${CMAKE_CURRENT_BINARY_DIR}/empty-dir")
  file(MAKE_DIRECTORY "${empty_dir}")
  foreach(dir IN LISTS HOXCM_PACKAGE_STATE_DIRS)
    install(DIRECTORY "${empty_dir}/" DESTINATION "${dir}"
            DIRECTORY_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE)
  endforeach()
  foreach(dir IN LISTS HOXCM_PACKAGE_SHARED_DIRS)
    install(DIRECTORY "${empty_dir}/" DESTINATION "${dir}")
  endforeach()
endif()

# Documentation every Debian package carries: the copyright file and the
# changelog, compressed as Debian policy wants it.
set(HOXCM_DOCDIR "${CMAKE_INSTALL_DATADIR}/doc")
configure_file("${CMAKE_CURRENT_LIST_DIR}/debian/changelog.in" "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian" @ONLY)
add_custom_command(OUTPUT "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian.gz"
  COMMAND gzip -9nf -k "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian"
  DEPENDS "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian" VERBATIM)
add_custom_target(hoxcm_package_docs ALL DEPENDS "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian.gz")
foreach(component_package IN ITEMS "runtime;hoxcm" "dev;hoxcm-dev")
  list(GET component_package 0 component)
  list(GET component_package 1 package)
  install(FILES "${CMAKE_CURRENT_LIST_DIR}/debian/copyright" "${CMAKE_CURRENT_BINARY_DIR}/debian/changelog.Debian.gz"
          DESTINATION "${HOXCM_DOCDIR}/${package}" COMPONENT ${component})
endforeach()

set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL runtime dev)
set(CPACK_PACKAGE_NAME hoxcm)
set(CPACK_PACKAGE_VERSION "${PROJECT_VERSION}")
set(CPACK_PACKAGE_CONTACT "hoxcm developers <hoxcm-dev@lists.tarvik.example>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
# Depends from the shared libraries the programs link (dpkg-shlibdeps), and
# a shlibs file with an ldconfig trigger for the library itself.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME hoxcm)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION admin)
# The script runner is Python; dpkg-shlibdeps cannot see that.
set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS "python3")
# First line: the synopsis; CPack indents the rest and marks empty lines.
# CPack puts the package summary before it unless the summary is CPack's
# default, so that is what it is given.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${CMAKE_PROJECT_NAME} built using CMake")
set(CPACK_DEBIAN_RUNTIME_DESCRIPTION [=[host configuration manager
hoxcm keeps a host's configuration in the desired state that one JSON
document describes: it validates the document, computes its drift from
the host, says what applying it costs (nothing, maintenance mode or a
reboot), reports compliance and applies it through plugins that run in
separate processes.

This package holds the library, the hoxcfg command, the plugin runners,
the manifest schemas, the sample host and the systemd units.]=])

set(CPACK_DEBIAN_DEV_PACKAGE_NAME hoxcm-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
# The public headers include RapidJSON's.
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS "hoxcm (= ${PROJECT_VERSION}-1), rapidjson-dev")
set(CPACK_DEBIAN_DEV_DESCRIPTION [=[host configuration manager (development files)
Headers, the CMake package (find_package(hoxcm)) and the pkg-config file
hoxcm.pc for programs and plugins built against the hoxcm library.]=])

# Maintainer scripts: the state of the systemd units that the runtime
# component installs (systemd/units.cmake) on install and removal.
string(JOIN " " HOXCM_SYSTEMD_UNITS ${HOXCM_UNITS})
foreach(script IN ITEMS postinst postrm)
  configure_file("${CMAKE_CURRENT_LIST_DIR}/debian/${script}.in" "${CMAKE_CURRENT_BINARY_DIR}/debian/${script}" @ONLY
                 FILE_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
  list(APPEND CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA "${CMAKE_CURRENT_BINARY_DIR}/debian/${script}")
endforeach()
# The loader's cache learns of the library when dpkg runs its triggers.
list(APPEND CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA "${CMAKE_CURRENT_LIST_DIR}/debian/triggers")

include(CPack)
