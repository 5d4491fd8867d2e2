// Runs a fuzz target over stored inputs without libFuzzer, so the corpus is a regression test in
// every build (normal, ASan, TSan).
//
// Usage: <target> <file or directory>...  Every regular file named, or found directly inside a
// named directory, is one input; inputs run in name order so a failure names the same file each
// time. Exits 1 when a path cannot be read or when no input was found at all: an empty or
// misplaced corpus must not pass silently. A broken property aborts the process, naming the input
// on standard error just before it runs.

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <system_error>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* apData, size_t aSize);
extern "C" int LLVMFuzzerInitialize(int* apArgc, char*** apArgv) __attribute__((weak));

namespace {

bool collect(const std::filesystem::path& acrPath, std::vector<std::filesystem::path>& arInputs) {
  std::error_code lError;
  if (std::filesystem::is_regular_file(acrPath, lError)) {
    arInputs.push_back(acrPath);
    return true;
  }
  if (!std::filesystem::is_directory(acrPath, lError)) {
    fprintf(stderr, "%s: not a file or directory\n", acrPath.c_str());
    return false;
  }
  std::vector<std::filesystem::path> lFound;
  for (const auto& lrEntry : std::filesystem::directory_iterator(acrPath, lError)) {
    if (lrEntry.is_regular_file()) lFound.push_back(lrEntry.path());
  }
  if (lError) {
    fprintf(stderr, "%s: %s\n", acrPath.c_str(), lError.message().c_str());
    return false;
  }
  std::sort(lFound.begin(), lFound.end());
  arInputs.insert(arInputs.end(), lFound.begin(), lFound.end());
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  if (LLVMFuzzerInitialize != nullptr) LLVMFuzzerInitialize(&argc, &argv);
  std::vector<std::filesystem::path> lInputs;
  for (int lIndex = 1; lIndex < argc; ++lIndex) {
    if (!collect(argv[lIndex], lInputs)) return 1;
  }
  if (lInputs.empty()) {
    fprintf(stderr, "no inputs found\n");
    return 1;
  }
  for (const auto& lrInput : lInputs) {
    std::ifstream lStream(lrInput, std::ios::binary);
    const std::vector<char> lBytes((std::istreambuf_iterator<char>(lStream)),
                                   std::istreambuf_iterator<char>());
    if (!lStream.eof() && lStream.fail()) {
      fprintf(stderr, "%s: cannot be read\n", lrInput.c_str());
      return 1;
    }
    fprintf(stderr, "running %s (%zu bytes)\n", lrInput.c_str(), lBytes.size());
    // Like libFuzzer, never pass a null pointer, also for an empty input: the targets may hand it
    // to functions that require one (strnlen).
    static const uint8_t kNoBytes[1] = {0};
    const uint8_t* lpData = lBytes.empty() ? kNoBytes : reinterpret_cast<const uint8_t*>(lBytes.data());
    LLVMFuzzerTestOneInput(lpData, lBytes.size());
  }
  printf("%zu inputs ran without a fault\n", lInputs.size());
  return 0;
}
