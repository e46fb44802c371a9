# The Debian packages, one of each component. scripts/package makes them.
set(ZELO_MAINTAINER "libzeloqrmclient maintainers <maintainers@example.org>" CACHE STRING
    "Name and mail address in the Debian packages")

set(CPACK_GENERATOR DEB)
set(CPACK_OUTPUT_FILE_PREFIX ${CMAKE_BINARY_DIR}/packages)
set(CPACK_PACKAGE_NAME libzeloqrmclient)
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE
    GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
set(CPACK_STRIP_FILES ON)
set(CPACK_PRE_BUILD_SCRIPTS ${CMAKE_CURRENT_LIST_DIR}/debian/complete.cmake)
set(CPACK_POST_BUILD_SCRIPTS ${CMAKE_CURRENT_LIST_DIR}/debian/mend.cmake)
set(CPACK_ZELO_CURL_VERSION ${ZELO_CURL_VERSION})
set(CPACK_COMPONENTS_ALL runtime devel tools)
set(CPACK_DEB_COMPONENT_INSTALL ON)

set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_MAINTAINER ${ZELO_MAINTAINER})
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${CMAKE_LIBRARY_OUTPUT_DIRECTORY})
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY >=)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME libzeloqrmclient1)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${CMAKE_CURRENT_LIST_DIR}/debian/triggers)
set(CPACK_COMPONENT_RUNTIME_DESCRIPTION
"storage appliances as clients of a QRM server
The library joins a storage appliance to a central management server, the
QRM server, calls its Web APIs, pushes log entries, fetches files, and leaves
the server again. The package holds the host platform for Linux too.")

set(CPACK_DEBIAN_DEVEL_PACKAGE_NAME libzeloqrmclient-dev)
set(CPACK_DEBIAN_DEVEL_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVEL_PACKAGE_DEPENDS
    "libzeloqrmclient1 (= ${PROJECT_VERSION}), libjsoncpp-dev")
set(CPACK_COMPONENT_DEVEL_DESCRIPTION
"storage appliances as clients of a QRM server (development files)
What compiling and linking a program with libzeloqrmclient needs: the
headers, a CMake package and a pkg-config file.")

set(CPACK_DEBIAN_TOOLS_PACKAGE_NAME zeloqrm-tools)
set(CPACK_DEBIAN_TOOLS_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_TOOLS_PACKAGE_DEPENDS "libzeloqrmclient1 (= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_TOOLS_PACKAGE_RECOMMENDS bubblewrap)
set(CPACK_COMPONENT_TOOLS_DESCRIPTION
"storage appliances as clients of a QRM server (programs)
qrmctl joins an appliance to a QRM server, shows its membership and leaves
the server again. qrm-devserver is a QRM server for development, and box runs
a program as if it ran on an appliance.")

include(CPack)
