# Writes the page's files into one source file, each as it is and compressed, so that the program needs no folder beside
# it.
#
#   cmake -DOUTPUT=Page.cpp -DFOLDER=page -DFILES="index.html;app.js" -P EmbedPage.cmake

function(append_bytes name file)
  file(READ ${file} hex HEX)
  # gzip notes the time; without it the same page gives the same program.
  string(REGEX REPLACE "^(1f8b08..)........" "\\100000000" hex "${hex}")
  string(REGEX REPLACE "([0-9a-f][0-9a-f])" "0x\\1," bytes "${hex}")
  # Some editors and compilers mind lines of a hundred thousand characters.
  string(REGEX REPLACE "((0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],)(0x[0-9a-f][0-9a-f],))"
    "\\1\n" bytes "${bytes}")
  set(text "${text}const unsigned char ${name}[] = {\n${bytes}};\n" PARENT_SCOPE)
endfunction()

set(types_html "text/html; charset=utf-8")
set(types_css "text/css; charset=utf-8")
set(types_js "text/javascript; charset=utf-8")
set(types_svg "image/svg+xml")

set(text "#include \"server/browser/PageFile.h\"\n\nnamespace Kdd::Browser\n{\nnamespace\n{\n\n")
set(rows "")
set(number 0)
foreach(file IN LISTS FILES)
  string(REGEX REPLACE ".*\\." "" ending ${file})
  append_bytes(kContent${number} ${FOLDER}/${file})
  file(ARCHIVE_CREATE OUTPUT ${OUTPUT}.gz PATHS ${FOLDER}/${file} FORMAT raw COMPRESSION GZip)
  append_bytes(kCompressed${number} ${OUTPUT}.gz)
  file(REMOVE ${OUTPUT}.gz)
  file(SHA256 ${FOLDER}/${file} digest)
  string(SUBSTRING ${digest} 0 32 digest)
  string(APPEND rows "    {\"${file}\", \"${types_${ending}}\", \"${digest}\", kContent${number}, int(sizeof kContent${number}),\n"
    "     kCompressed${number}, int(sizeof kCompressed${number})},\n")
  math(EXPR number "${number} + 1")
endforeach()
string(APPEND text "\nconst PageFile kFiles[] = {\n${rows}};\n\n}  // namespace\n\n"
  "const PageFile* findPageFile(const QByteArray& name)\n{\n"
  "    for (const PageFile& file : kFiles)\n        if (name == file.name)\n            return &file;\n"
  "    return nullptr;\n}\n\n}  // namespace Kdd::Browser\n")
file(WRITE ${OUTPUT} "${text}")
