// The logger is the library's hottest path: every operation logs "Entered" and "Left" and the
// default mask writes them. Measured here, in one run:
//   BM_Logger_TraceLine          lines/s through the logger with the default mask, to a file
//   BM_Baseline_WritePerLine     lines/s of the naive logger: format the same line, one write() each
//   BM_Logger_MaskedOffTrace     the cost of a trace call whose level is masked off
// The ratio of the first two (items_per_second) is the figure that matters; both run with 1 and 2
// threads.

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>

#include "BenchSupport.h"
#include "Logger.h"
#include "QNString.h"

namespace {

// Both files live in one fresh directory; each run starts them empty so the disk does not fill.
struct BenchFiles {
  std::string mLog;
  std::string mBaseline;
  int mBaselineFd = -1;
};

BenchFiles& files() {
  static BenchFiles sFiles;
  static std::once_flag sOnce;
  std::call_once(sOnce, [] {
    char lTemplate[] = "/tmp/qnbench.XXXXXX";
    if (mkdtemp(lTemplate) == nullptr) abort();
    sFiles.mLog = std::string(lTemplate) + "/logger.log";
    sFiles.mBaseline = std::string(lTemplate) + "/baseline.log";
    sFiles.mBaselineFd = open(sFiles.mBaseline.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (sFiles.mBaselineFd < 0) abort();
    CreateLogger(sFiles.mLog.c_str());
  });
  return sFiles;
}

void startEmpty(const benchmark::State& acrState) {
  if (acrState.thread_index() != 0) return;
  // Both files are appended to, so cutting them to nothing is safe while they stay open.
  (void)!truncate(files().mLog.c_str(), 0);
  (void)!truncate(files().mBaseline.c_str(), 0);
}

void BM_Logger_TraceLine(benchmark::State& arState) {
  files();
  qnbench::setTraceLogging(true);
  startEmpty(arState);
  for (auto _ : arState) QN_ENTERED();
  arState.SetItemsProcessed(arState.iterations());
}
BENCHMARK(BM_Logger_TraceLine)->Threads(1)->Threads(2)->UseRealTime();

// The same line as the logger writes, formatted the plain way and written with one write() each:
// what the logger did before it buffered.
__attribute__((noinline, format(printf, 6, 7))) void naiveLogLine(int aFd, const char* apTag,
                                                                  unsigned int aLine, const char* apFunction,
                                                                  const char* apFile, const char* apFormat,
                                                                  ...) {
  char lLine[kQNLogMaxLine];
  struct timeval lNow;
  gettimeofday(&lNow, nullptr);
  struct tm lTm;
  localtime_r(&lNow.tv_sec, &lTm);
  int lUsed = snprintf(lLine, sizeof lLine, "%04d-%02d-%02d %02d:%02d:%02d.%06ld %s [%ld] %s (%s:%u) ",
                       lTm.tm_year + 1900, lTm.tm_mon + 1, lTm.tm_mday, lTm.tm_hour, lTm.tm_min, lTm.tm_sec,
                       static_cast<long>(lNow.tv_usec), apTag, static_cast<long>(syscall(SYS_gettid)),
                       apFunction, apFile, aLine);
  va_list lArgs;
  va_start(lArgs, apFormat);
  lUsed += vsnprintf(lLine + lUsed, sizeof lLine - lUsed - 1, apFormat, lArgs);
  va_end(lArgs);
  lLine[lUsed++] = '\n';
  (void)!write(aFd, lLine, static_cast<size_t>(lUsed));
}

void BM_Baseline_WritePerLine(benchmark::State& arState) {
  const int lFd = files().mBaselineFd;
  startEmpty(arState);
  for (auto _ : arState) naiveLogLine(lFd, "-T-", __LINE__, __func__, __FILE__, "%s", "Entered");
  arState.SetItemsProcessed(arState.iterations());
}
BENCHMARK(BM_Baseline_WritePerLine)->Threads(1)->Threads(2)->UseRealTime();

// The argument must never be evaluated when the level is off; if it were, this would cost a call.
__attribute__((noinline)) const char* expensiveArgument() {
  static std::string sText(100, 'x');
  benchmark::DoNotOptimize(sText.data());
  return sText.c_str();
}

void BM_Logger_MaskedOffTrace(benchmark::State& arState) {
  files();
  qnbench::setTraceLogging(false);
  for (auto _ : arState) QN_LOG_TRACE("%s", expensiveArgument());
  qnbench::setTraceLogging(true);
}
BENCHMARK(BM_Logger_MaskedOffTrace);

}  // namespace

QN_BENCHMARK_MAIN();
