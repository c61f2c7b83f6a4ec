#include "tools/collector/NumberedFiles.h"

#include "tools/files/WholeFile.h"

namespace vesk {

std::filesystem::path NumberedFiles::save(std::string_view bytes, const std::string& ending) {
  std::filesystem::create_directories(_directory);
  std::filesystem::path path;
  do {
    path = _directory / (std::to_string(++_last) + ending);
  } while (std::filesystem::exists(path));
  writeWholeFile(path, bytes, 0644);
  return path;
}

}  // namespace vesk
