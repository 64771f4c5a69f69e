cmake_minimum_required(VERSION 3.25)
# Writes OUT, a source that holds the FILES below FOLDER (a list with commas): the page is a part of the program, so that no
# other file has to be found at run time.
string(REPLACE "," ";" files "${FILES}")
set(text "#include \"studio/server/page_files.h\"\n\nnamespace calmframe::studio {\nnamespace {\n\n")
set(rows "")
set(number 0)
foreach(file IN LISTS files)
  file(READ "${FOLDER}/${file}" hex HEX)
  string(REGEX REPLACE "([0-9a-f][0-9a-f])" "0x\\1," bytes "${hex}")
  string(APPEND text "constexpr unsigned char kFile${number}[] = {${bytes}0};\n")
  string(APPEND rows
    "    {\"${file}\", {reinterpret_cast<const char*>(kFile${number}), sizeof kFile${number} - 1}},\n")
  math(EXPR number "${number} + 1")
endforeach()
string(APPEND text "\nconst PageFile kFiles[] = {\n${rows}};\n\n}  // namespace\n\n"
  "const PageFile* FindPageFile(std::string_view path) {\n"
  "  for (const PageFile& file : kFiles) {\n    if (file.path == path) return &file;\n  }\n"
  "  return nullptr;\n}\n\n}  // namespace calmframe::studio\n")
file(WRITE "${OUT}" "${text}")
