# Defines KeloDRCore::JsonCpp. The build and the installed package both include this file: JsonCpp
# 1.9.5's own CMake package cannot be loaded twice in one project, so a library that loads it would
# break every consumer that loads it too.
include_guard(DIRECTORY)
if(NOT TARGET KeloDRCore::JsonCpp)
  find_path(KELODR_JSONCPP_INCLUDE_DIR json/json.h PATH_SUFFIXES jsoncpp)
  find_library(KELODR_JSONCPP_LIBRARY jsoncpp)
  mark_as_advanced(KELODR_JSONCPP_INCLUDE_DIR KELODR_JSONCPP_LIBRARY)
  if(KELODR_JSONCPP_INCLUDE_DIR AND KELODR_JSONCPP_LIBRARY)
    add_library(KeloDRCore::JsonCpp UNKNOWN IMPORTED GLOBAL)
    set_target_properties(KeloDRCore::JsonCpp PROPERTIES
      IMPORTED_LOCATION "${KELODR_JSONCPP_LIBRARY}"
      INTERFACE_INCLUDE_DIRECTORIES "${KELODR_JSONCPP_INCLUDE_DIR}")
  elseif(NOT CMAKE_FIND_PACKAGE_NAME)
    message(FATAL_ERROR "JsonCpp was not found (Debian: libjsoncpp-dev)")
  endif()
endif()
