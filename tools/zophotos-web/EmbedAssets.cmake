# Writes a source with the content of assets.
#   cmake -DOUTPUT=FILE -DDIRECTORY=DIR -DNAMES=NAME,... -P EmbedAssets.cmake
set(types
  css "text/css\; charset=utf-8"
  js "text/javascript\; charset=utf-8"
  svg "image/svg+xml")
string(REPLACE "," ";" NAMES "${NAMES}")
set(rows "")
foreach(name IN LISTS NAMES)
  set(file ${DIRECTORY}/${name})
  file(READ ${file} content)
  file(SHA256 ${file} hash)
  string(SUBSTRING ${hash} 0 16 hash)
  cmake_path(GET name EXTENSION LAST_ONLY extension)
  string(SUBSTRING ${extension} 1 -1 extension)
  list(FIND types ${extension} place)
  math(EXPR place "${place} + 1")
  list(GET types ${place} type)
  string(APPEND rows "    {.path = \"/${name}\",\n     .type = \"${type}\",\n"
    "     .etag = \"\\\"${hash}\\\"\",\n     .content = R\"embedded(${content})embedded\"},\n")
endforeach()
list(LENGTH NAMES count)
file(WRITE ${OUTPUT} "#include \"zophotos-web/Assets.h\"

#include <algorithm>
#include <array>

namespace orva::web {

namespace {

constexpr std::array<Asset, ${count}> ASSETS = {{
${rows}}};

} // namespace

const Asset* FindAsset(std::string_view path) {
  const auto* const found = std::ranges::find(ASSETS, path, &Asset::path);
  return found == ASSETS.end() ? nullptr : found;
}

} // namespace orva::web
")
