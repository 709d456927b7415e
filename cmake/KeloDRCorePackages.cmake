# The Debian packages, made by cpack: the library, its development files and the example programs.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME kelodrcore)
set(CPACK_PACKAGE_CONTACT "KeloDRCore maintainers <maintainers@kelodrcore.example>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY >=)

# What each package depends on besides what its programs are linked with.
set(library_package libkelodrcore${PROJECT_VERSION_MAJOR})
set(same_version "(= ${PROJECT_VERSION})")
set(runtime_depends uuid-runtime)
set(development_depends "${library_package} ${same_version}, libjsoncpp-dev")
set(examples_depends "${library_package} ${same_version}")
if(CMAKE_CROSSCOMPILING)
  # dpkg-shlibdeps asks the packages that are installed, and those for i386 are not.
  set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE i386)
  get_filename_component(libraries ${KELODR_JSONCPP_LIBRARY} DIRECTORY)
  file(GLOB jsoncpp RELATIVE ${libraries} ${libraries}/libjsoncpp.so.??)
  string(REPLACE .so. "" jsoncpp ${jsoncpp})
  set(linked "libc6, libgcc-s1, libstdc++6, ${jsoncpp}")
  string(APPEND runtime_depends ", ${linked}, libsqlite3-0")
  string(APPEND examples_depends ", ${linked}")
else()
  set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
  # drctl needs the library of its own package set, which is not installed while packages are made.
  set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${PROJECT_BINARY_DIR}/src)
endif()

# The changelog of Debian's form has the date that CHANGELOG.md tells.
string(REPLACE . \\. version "${PROJECT_VERSION}")
file(STRINGS CHANGELOG.md release_date REGEX "^## \\[${version}\\] - ")
string(REGEX REPLACE ".* - " "" release_date "${release_date}")
execute_process(COMMAND date --utc --rfc-email --date=${release_date}
                OUTPUT_VARIABLE release_date OUTPUT_STRIP_TRAILING_WHITESPACE)
set(changelog ${PROJECT_BINARY_DIR}/changelog)
configure_file(cmake/debian/changelog.in ${changelog} @ONLY)
execute_process(COMMAND gzip --no-name --best --keep --force ${changelog})

# kelodr_package(COMPONENT NAME SECTION DESCRIPTION): one package. Its papers are no part of an
# installation without packages.
function(kelodr_package component name section description)
  string(TOUPPER ${component} upper)
  set(CPACK_DEBIAN_${upper}_PACKAGE_NAME ${name} PARENT_SCOPE)
  set(CPACK_DEBIAN_${upper}_PACKAGE_SECTION ${section} PARENT_SCOPE)
  set(CPACK_DEBIAN_${upper}_PACKAGE_DEPENDS "${${component}_depends}" PARENT_SCOPE)
  set(CPACK_COMPONENT_${upper}_DESCRIPTION "${description}" PARENT_SCOPE)
  set(CPACK_COMPONENTS_ALL ${CPACK_COMPONENTS_ALL} ${component} PARENT_SCOPE)
  install(FILES ${changelog}.gz cmake/debian/copyright
          DESTINATION ${CMAKE_INSTALL_DATADIR}/doc/${name} COMPONENT ${component} EXCLUDE_FROM_ALL)
endfunction()

kelodr_package(runtime ${library_package} libs
  "SQL layer over SQLite, JSON and key=value files, file locks, a shared JSON
cache and the messages of the package's web API. This package holds the shared
library.")
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/cmake/debian/triggers)
kelodr_package(development libkelodrcore-dev libdevel
  "Headers, CMake package and pkg-config file for programs that use the library.")
if(KELODR_BUILD_EXAMPLES)
  kelodr_package(examples kelodr-examples admin
    "drctl, a registry of replication nodes and of this machine's volumes.")
endif()

include(CPack)
