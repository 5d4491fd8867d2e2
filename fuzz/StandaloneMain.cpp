// Runs a fuzz target over stored inputs without libFuzzer, so the corpus is a regression test in
// every build (normal, ASan, TSan).
//
// Usage: <target> <directory>...  Every regular file directly inside a named directory is one
// input; inputs run in name order so a failure names the same file each time. Exits 1 when no
// input was found at all: an empty or misplaced corpus must not pass silently. A directory that
// cannot be read throws std::filesystem::filesystem_error, which ends the run with a failure too.
// A broken property aborts the process, naming the input on standard error just before it runs.

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize);
extern "C" int LLVMFuzzerInitialize(int* apArgc, char*** apArgv) __attribute__((weak));

int main(int argc, char** argv) {
  if (LLVMFuzzerInitialize != nullptr) LLVMFuzzerInitialize(&argc, &argv);
  std::vector<std::filesystem::path> lInputs;
  for (int lIndex = 1; lIndex < argc; ++lIndex) {
    for (const auto& lrEntry : std::filesystem::directory_iterator(argv[lIndex]))
      if (lrEntry.is_regular_file()) lInputs.push_back(lrEntry.path());
  }
  if (lInputs.empty()) {
    fprintf(stderr, "no inputs found\n");
    return 1;
  }
  std::sort(lInputs.begin(), lInputs.end());
  for (const auto& lrInput : lInputs) {
    std::ifstream lStream(lrInput, std::ios::binary);
    const std::vector<char> lBytes((std::istreambuf_iterator<char>(lStream)),
                                   std::istreambuf_iterator<char>());
    fprintf(stderr, "running %s (%zu bytes)\n", lrInput.c_str(), lBytes.size());
    // Like libFuzzer, never pass a null pointer, also for an empty input: the targets may hand it
    // to functions that require one (strnlen).
    static const uint8_t kNoBytes[1] = {0};
    LLVMFuzzerTestOneInput(lBytes.empty() ? kNoBytes : reinterpret_cast<const uint8_t*>(lBytes.data()),
                           lBytes.size());
  }
  printf("%zu inputs ran without a fault\n", lInputs.size());
  return 0;
}
