// Runs the fuzz targets as ordinary tests: each seed unchanged, cut after each byte, and with each byte
// changed. Usage: TARGET DIRECTORY
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <string_view>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace {

void run(std::string_view input) {
  // An exact-size copy, so that sanitizers detect reads beyond the end.
  const std::vector<std::uint8_t> bytes(input.begin(), input.end());
  (void)LLVMFuzzerTestOneInput(bytes.data(), bytes.size());
}

}  // namespace

int main(int argumentCount, char** arguments) {
  int seeds = 0;
  for (const auto& entry : std::filesystem::directory_iterator(argumentCount == 2 ? arguments[1] : ".")) {
    std::ifstream file(entry.path(), std::ios::binary);
    std::string seed{std::istreambuf_iterator<char>(file), {}};
    std::printf("%s: %zu bytes\n", entry.path().c_str(), seed.size());
    std::fflush(stdout);
    for (std::size_t end = 0; end <= seed.size(); ++end) run(std::string_view(seed).substr(0, end));
    for (char& byte : seed) {
      for (const char change : {'\x01', '\x10', '\xff'}) {
        byte = static_cast<char>(byte ^ change);
        run(seed);
        byte = static_cast<char>(byte ^ change);
      }
    }
    ++seeds;
  }
  return seeds > 0 ? 0 : 1;
}
