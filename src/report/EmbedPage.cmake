# Writes the report page's files into a C++ source as raw string literals,
# so that the page can be edited as ordinary HTML, CSS and JavaScript files.
# Run with -DPAGE_DIR=... -DOUTPUT=...
set(names kHtml kStyle kScript)
set(files report.html report.css report.js)
set(body "// Generated from src/report/page/ by EmbedPage.cmake; edit those files instead.\n")
string(APPEND body "#include \"report/ReportTemplate.h\"\n\nnamespace VeltoTouch::ReportTemplate {\n\n")
foreach(name file IN ZIP_LISTS names files)
  file(READ ${PAGE_DIR}/${file} text)
  string(FIND "${text}" ")velto_page\"" clash)
  if(NOT clash EQUAL -1)
    message(FATAL_ERROR "${file} contains the raw string's closing delimiter")
  endif()
  string(APPEND body "extern const std::string_view ${name} = R\"velto_page(${text})velto_page\";\n\n")
endforeach()
string(APPEND body "}  // namespace VeltoTouch::ReportTemplate\n")
# Only a changed text rewrites the file, so nothing rebuilds otherwise.
if(EXISTS ${OUTPUT})
  file(READ ${OUTPUT} previous)
endif()
if(NOT "${previous}" STREQUAL "${body}")
  file(WRITE ${OUTPUT} "${body}")
endif()
