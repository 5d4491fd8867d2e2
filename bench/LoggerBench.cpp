// Logging to a file: the logger against spdlog, the library a user would pick instead.
//
//   Logger/<threads>/ours          PrintLogMessageWithTimeStamp behind the QN_LOG_TRACE test
//   Logger/<threads>/spdlog_sync   spdlog's basic_logger_mt (a mutex and a FILE per logger)
//   Logger/<threads>/spdlog_async  spdlog's async logger (a queue and one worker) on a file sink
//   Logger/<threads>/floor         what the logger's contract requires and nothing more: a line
//                                  already formatted, copied whole into one shared batch under
//                                  one lock (a spinning one, the cheapest), the batch written
//                                  with write(2) when full and at the end of the round
//   Logger/maskedoff/{ours,spdlog} a trace call whose level is masked off
//
// Every contender writes the same 126-byte line (time to the microsecond, tag, thread id, function,
// file, source line, "Entered"), so the volume in bytes is the same. One iteration is a round of
// kRoundLines lines per thread that ends when every line of the round is in the file (handed to
// the kernel): ours with flushLogger(), spdlog sync with flush() (fflush of its FILE), spdlog
// async with flush() and then waiting until its worker has carried out that flush, which it does
// after every line queued before it. Throughput is lines/s of all threads together.

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spdlog/async.h>
#include <spdlog/sinks/basic_file_sink.h>
#include <spdlog/spdlog.h>
#include <unistd.h>

#include <atomic>
#include <condition_variable>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <mutex>
#include <string>

#include "BenchSupport.h"
#include "Logger.h"
#include "QNString.h"

namespace {

constexpr int kRoundLines = 10000;

// The call site every contender logs from; with a 4-digit thread id each line is 126 bytes.
constexpr const char* kFunction = "acquireSensorSampleBatch";
constexpr const char* kFile = "examples/qnsensord/SensorSampleSourceReader.cpp";
constexpr unsigned int kLine = 2148;

// A second sink of the async logger that takes no lines (its level is off) and counts the flushes
// spdlog's worker makes: the worker flushes its sinks in order, the file first, and only after
// every line queued before the flush request.
class QNCFlushCounter : public spdlog::sinks::base_sink<spdlog::details::null_mutex> {
 public:
  QNCFlushCounter() { set_level(spdlog::level::off); }
  // Requests a flush and waits until the worker has made it. Requests are numbered in the order
  // they enter the queue, which is the order the worker makes them.
  void flushAndWait(spdlog::async_logger& arLogger) {
    unsigned long lTicket = 0;
    {
      std::lock_guard<std::mutex> lPostGuard(mPostLock);
      lTicket = ++mRequested;
      arLogger.flush();
    }
    std::unique_lock<std::mutex> lGuard(mLock);
    mFlushed.wait(lGuard, [&] { return mFlushes >= lTicket; });
  }

 protected:
  void sink_it_(const spdlog::details::log_msg&) override {}
  void flush_() override {
    std::lock_guard<std::mutex> lGuard(mLock);
    ++mFlushes;
    mFlushed.notify_all();
  }

 private:
  std::mutex mPostLock;  // guards mRequested and the order of flush requests
  unsigned long mRequested = 0;
  std::mutex mLock;  // guards mFlushes
  std::condition_variable mFlushed;
  unsigned long mFlushes = 0;
};

struct QNSBenchFiles {
  std::string mOurs, mSync, mAsync, mFloor;
  std::shared_ptr<spdlog::logger> mpSync;
  std::shared_ptr<spdlog::async_logger> mpAsync;
  std::shared_ptr<QNCFlushCounter> mpAsyncFlushes;
};

QNSBenchFiles& files() {
  static QNSBenchFiles* const spFiles = [] {
    auto* lpFiles = new QNSBenchFiles;
    const char* lpDir = getenv("QN_LOG_DIR");
    std::string lDir = lpDir != nullptr ? lpDir : "";
    if (lDir.empty()) {
      char lTemplate[] = "/tmp/qnbench.XXXXXX";
      if (mkdtemp(lTemplate) == nullptr) abort();
      lDir = lTemplate;
    }
    lpFiles->mOurs = lDir + "/ours.log";
    lpFiles->mSync = lDir + "/spdlog_sync.log";
    lpFiles->mAsync = lDir + "/spdlog_async.log";
    lpFiles->mFloor = lDir + "/floor.log";
    CreateLogger(QNCString(lpFiles->mOurs.c_str()));
    const char* lpPattern = "%Y-%m-%d %H:%M:%S.%f -T- [%t] %! (%g:%#) %v";
    lpFiles->mpSync = spdlog::basic_logger_mt("sync", lpFiles->mSync);
    lpFiles->mpSync->set_pattern(lpPattern);
    lpFiles->mpSync->set_level(spdlog::level::trace);
    spdlog::init_thread_pool(8192, 1);  // spdlog's default queue and one worker
    lpFiles->mpAsyncFlushes = std::make_shared<QNCFlushCounter>();
    const spdlog::sinks_init_list lSinks{std::make_shared<spdlog::sinks::basic_file_sink_st>(lpFiles->mAsync),
                                         lpFiles->mpAsyncFlushes};
    lpFiles->mpAsync = std::make_shared<spdlog::async_logger>("async", lSinks, spdlog::thread_pool(),
                                                              spdlog::async_overflow_policy::block);
    lpFiles->mpAsync->set_pattern(lpPattern);
    lpFiles->mpAsync->set_level(spdlog::level::trace);
    return lpFiles;
  }();
  return *spFiles;
}

// Each run starts its file empty so that the disk does not fill; every file is opened for
// appending, so cutting it while it stays open is safe. Thread 0 does it before the threads start
// logging together.
void startEmpty(const benchmark::State& acrState, const std::string& acrPath) {
  if (acrState.thread_index() == 0) (void)!truncate(acrPath.c_str(), 0);
}

void ours(benchmark::State& arState) {
  startEmpty(arState, files().mOurs);
  qnbench::setTraceLogging(true);
  for (auto _ : arState) {
    for (int lLine = 0; lLine < kRoundLines; ++lLine) {
      // What QN_LOG_TRACE expands to, from a fixed call site so that every contender's line is the same.
      if (QNIsLogLevelOn(QNLL_Trace))
        PrintLogMessageWithTimeStamp(QNLL_Trace, "-T-", kLine, kFunction, kFile, "%s", "Entered");
    }
    flushLogger();
  }
  arState.SetItemsProcessed(arState.iterations() * kRoundLines);
}

void spdlogSync(benchmark::State& arState) {
  startEmpty(arState, files().mSync);
  spdlog::logger& lrLogger = *files().mpSync;
  const spdlog::source_loc lWhere{kFile, static_cast<int>(kLine), kFunction};
  for (auto _ : arState) {
    for (int lLine = 0; lLine < kRoundLines; ++lLine)
      lrLogger.log(lWhere, spdlog::level::trace, "{}", "Entered");
    lrLogger.flush();
  }
  arState.SetItemsProcessed(arState.iterations() * kRoundLines);
}

void spdlogAsync(benchmark::State& arState) {
  startEmpty(arState, files().mAsync);
  spdlog::async_logger& lrLogger = *files().mpAsync;
  QNCFlushCounter& lrFlushes = *files().mpAsyncFlushes;
  const spdlog::source_loc lWhere{kFile, static_cast<int>(kLine), kFunction};
  for (auto _ : arState) {
    for (int lLine = 0; lLine < kRoundLines; ++lLine)
      lrLogger.log(lWhere, spdlog::level::trace, "{}", "Entered");
    lrFlushes.flushAndWait(lrLogger);  // queued behind this thread's lines
  }
  arState.SetItemsProcessed(arState.iterations() * kRoundLines);
}

// The floor's shared batch: one lock, one buffer, one descriptor.
class QNCFloorSink {
 public:
  explicit QNCFloorSink(const std::string& acrPath)
      : mFd(open(acrPath.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0640)) {
    if (mFd < 0) abort();
  }
  void write(const char* apLine, size_t aLength) {
    while (mTaken.exchange(true, std::memory_order_acquire))
      while (mTaken.load(std::memory_order_relaxed)) __builtin_ia32_pause();
    if (sizeof mBatch - mUsed < aLength) _writeOut();
    memcpy(mBatch + mUsed, apLine, aLength);
    mUsed += aLength;
    mTaken.store(false, std::memory_order_release);
  }
  void flush() {
    while (mTaken.exchange(true, std::memory_order_acquire)) __builtin_ia32_pause();
    _writeOut();
    mTaken.store(false, std::memory_order_release);
  }

 private:
  void _writeOut() {
    if (::write(mFd, mBatch, mUsed) != static_cast<ssize_t>(mUsed)) abort();
    mUsed = 0;
  }
  alignas(64) std::atomic<bool> mTaken{false};
  size_t mUsed = 0;
  const int mFd;
  char mBatch[64 * 1024];
};

void floorSink(benchmark::State& arState) {
  startEmpty(arState, files().mFloor);
  static QNCFloorSink* const spSink = new QNCFloorSink(files().mFloor);
  // The same 126 bytes as the others' lines, formatted once.
  char lText[160];
  const int lLength =
      snprintf(lText, sizeof lText, "2026-11-23 16:42:00.123456 -T- [%4d] %s (%s:%u) Entered\n",
               1000 + arState.thread_index(), kFunction, kFile, kLine);
  for (auto _ : arState) {
    for (int lLine = 0; lLine < kRoundLines; ++lLine) spSink->write(lText, static_cast<size_t>(lLength));
    spSink->flush();
  }
  arState.SetItemsProcessed(arState.iterations() * kRoundLines);
}

BENCHMARK(ours)->Name("Logger/1thread/ours")->Threads(1)->UseRealTime()->MinTime(0.1);
BENCHMARK(spdlogSync)->Name("Logger/1thread/spdlog_sync")->Threads(1)->UseRealTime()->MinTime(0.1);
BENCHMARK(spdlogAsync)->Name("Logger/1thread/spdlog_async")->Threads(1)->UseRealTime()->MinTime(0.1);
BENCHMARK(ours)->Name("Logger/2threads/ours")->Threads(2)->UseRealTime()->MinTime(0.1);
BENCHMARK(spdlogSync)->Name("Logger/2threads/spdlog_sync")->Threads(2)->UseRealTime()->MinTime(0.1);
BENCHMARK(spdlogAsync)->Name("Logger/2threads/spdlog_async")->Threads(2)->UseRealTime()->MinTime(0.1);
BENCHMARK(floorSink)->Name("Logger/1thread/floor")->Threads(1)->UseRealTime()->MinTime(0.1);
BENCHMARK(floorSink)->Name("Logger/2threads/floor")->Threads(2)->UseRealTime()->MinTime(0.1);

// The argument is the same for both and cheap; ours must not even evaluate it.
const char* gspArgument = "an argument";

void oursMaskedOff(benchmark::State& arState) {
  files();
  qnbench::setTraceLogging(false);
  for (auto _ : arState) {
    benchmark::DoNotOptimize(gspArgument);
    QN_LOG_TRACE("%s", gspArgument);
  }
  qnbench::setTraceLogging(true);
  arState.SetItemsProcessed(arState.iterations());
}

void spdlogMaskedOff(benchmark::State& arState) {
  spdlog::logger& lrLogger = *files().mpSync;
  lrLogger.set_level(spdlog::level::info);
  for (auto _ : arState) {
    benchmark::DoNotOptimize(gspArgument);
    lrLogger.trace("{}", gspArgument);
  }
  lrLogger.set_level(spdlog::level::trace);
  arState.SetItemsProcessed(arState.iterations());
}

BENCHMARK(oursMaskedOff)->Name("Logger/maskedoff/ours")->MinTime(0.1);
BENCHMARK(spdlogMaskedOff)->Name("Logger/maskedoff/spdlog")->MinTime(0.1);

}  // namespace

QN_BENCHMARK_MAIN();
