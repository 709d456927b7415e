# The Debian packages, made by cpack: the library, its development files and the example programs.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME kelodrcore)
set(CPACK_PACKAGE_CONTACT "KeloDRCore maintainers <maintainers@kelodrcore.example>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_COMPONENTS_ALL runtime development)
if(KELODR_BUILD_EXAMPLES)
  list(APPEND CPACK_COMPONENTS_ALL examples)
endif()

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
# drctl needs the library of its own package set, which is not installed while packages are made.
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${PROJECT_BINARY_DIR}/src)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY >=)
set(library_package libkelodrcore${PROJECT_VERSION_MAJOR})
set(same_version "(= ${PROJECT_VERSION})")

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME ${library_package})
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS uuid-runtime)
set(CPACK_COMPONENT_RUNTIME_DESCRIPTION
  "SQL layer over SQLite, JSON and key=value files, file locks, a shared JSON cache
and the messages of the package's web API. This package holds the shared library.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libkelodrcore-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "${library_package} ${same_version}, libjsoncpp-dev")
set(CPACK_COMPONENT_DEVELOPMENT_DESCRIPTION
  "Headers, CMake package and pkg-config file for programs that use the library.")

set(CPACK_DEBIAN_EXAMPLES_PACKAGE_NAME kelodr-examples)
set(CPACK_DEBIAN_EXAMPLES_PACKAGE_SECTION admin)
set(CPACK_DEBIAN_EXAMPLES_PACKAGE_DEPENDS "${library_package} ${same_version}")
set(CPACK_COMPONENT_EXAMPLES_DESCRIPTION
  "drctl, a registry of replication nodes and of this machine's volumes.")

include(CPack)
