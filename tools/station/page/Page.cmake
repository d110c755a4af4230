# The page's files become a source of the station's library.
set(page_names index.html page.css format.js charts.js tables.js page.js icon.svg)
set(page_source ${CMAKE_CURRENT_BINARY_DIR}/PageFiles.cpp)
list(TRANSFORM page_names PREPEND ${CMAKE_CURRENT_LIST_DIR}/ OUTPUT_VARIABLE page_files)
string(REPLACE ";" "," page_name_list "${page_names}")
add_custom_command(OUTPUT ${page_source}
  COMMAND ${CMAKE_COMMAND} -DFOLDER=${CMAKE_CURRENT_LIST_DIR} -DNAMES=${page_name_list} -DOUTPUT=${page_source}
          -P ${CMAKE_CURRENT_LIST_DIR}/EmbedFiles.cmake
  DEPENDS ${page_files} ${CMAKE_CURRENT_LIST_DIR}/EmbedFiles.cmake
  COMMENT "Embedding the station's page" VERBATIM)
target_sources(station PRIVATE ${page_source})
target_include_directories(station PRIVATE ${PROJECT_SOURCE_DIR}/tools)
