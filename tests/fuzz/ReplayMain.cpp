// Runs a fuzz target over saved inputs: every file of the directories given as arguments, in the order of their names.
// This is how an ordinary build, without libFuzzer, keeps old findings from coming back. Finding no file is a failure.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

int main(int argc, char** argv) {
  std::vector<std::filesystem::path> inputs;
  for (int i = 1; i < argc; ++i) {
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(argv[i], error)) {
      if (entry.is_regular_file()) inputs.push_back(entry.path());
    }
    if (error) std::fprintf(stderr, "%s: %s\n", argv[i], error.message().c_str());
  }
  std::sort(inputs.begin(), inputs.end());
  for (const auto& path : inputs) {
    std::printf("%s\n", path.c_str());
    std::fflush(stdout);  // the name of the input that ends the process is the one to see
    std::ifstream file(path, std::fstream::binary);
    const std::vector<char> bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    // A buffer of exactly this size, so that a sanitizer sees a read past its end; never null.
    std::vector<std::uint8_t> input(bytes.begin(), bytes.end());
    input.reserve(1);
    (void)LLVMFuzzerTestOneInput(input.data(), input.size());
  }
  std::printf("%zu inputs\n", inputs.size());
  return inputs.empty() ? 1 : 0;
}
