# `doc`: the API reference of the public headers, written by Doxygen to doc/html in the build
# tree. Doxygen fails on a public declaration without its comment.
find_package(Doxygen QUIET)
if(DOXYGEN_FOUND)
  add_custom_target(doc
    COMMAND ${CMAKE_COMMAND} -E env
      FILEINDEX_DOC_DIR=${PROJECT_BINARY_DIR}/doc FILEINDEX_VERSION=${PROJECT_VERSION}
      ${DOXYGEN_EXECUTABLE} docs/Doxyfile
    WORKING_DIRECTORY ${PROJECT_SOURCE_DIR}
    COMMENT "Writing the API reference to ${PROJECT_BINARY_DIR}/doc/html"
    VERBATIM)
else()
  message(STATUS "Doxygen not found: no doc target")
endif()
