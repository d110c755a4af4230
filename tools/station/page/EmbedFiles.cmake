# cmake -DFOLDER=… -DNAMES=a,b -DOUTPUT=…/PageFiles.cpp -P embed.cmake: writes the files into a C++ source.
string(REPLACE "," ";" names "${NAMES}")
set(arrays "")
set(entries "")
set(index 0)
foreach(name IN LISTS names)
  file(READ ${FOLDER}/${name} bytes HEX)
  file(SHA256 ${FOLDER}/${name} hash)
  string(SUBSTRING ${hash} 0 16 tag)
  string(REGEX REPLACE "(................................)" "\\1\n" lines "${bytes}")
  string(REGEX REPLACE "([0-9a-f][0-9a-f])" "0x\\1," numbers "${lines}")
  string(APPEND arrays "const unsigned char kFile${index}[] = {\n${numbers}};\n")
  string(APPEND entries
    "    {\"${name}\", {reinterpret_cast<const char*>(kFile${index}), sizeof kFile${index}}, \"${tag}\"},\n")
  math(EXPR index "${index} + 1")
endforeach()
file(WRITE ${OUTPUT} "#include \"station/PageFiles.h\"

namespace tallyd::station {

namespace {

${arrays}
}  // namespace

std::span<const PageFile> pageFiles() {
  static const PageFile files[] = {
${entries}  };
  return files;
}

}  // namespace tallyd::station
")
