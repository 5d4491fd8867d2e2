// qnsensor-feed: sends sensor readings to qnsensord and checks every answer.
//
//   qnsensor-feed [-d dir] [-n readings] [-m connections] [-c channels] [-e malformed] [-x]
//
// Connection k talks to channel k % channels, the socket <dir>/qnsensord.<channel>.sock. Each
// connection sends its readings one at a time and waits for the answer, so the time from send to
// answer is one round trip. -e mixes that many malformed readings in (each must be refused);
// -x first opens one more connection that sends half a message and disconnects.
// Every answer must carry the sequence number of the reading just sent (so each reading is
// answered exactly once and in order) and accept or refuse it as expected. Prints readings/s,
// round-trip latency at p50 and p99, and the count of errors, then the same figures on one line
// for scripts ("figures: readings_per_s=<n> p50_us=<n> p99_us=<n> errors=<n>"); exits 0 only
// when there are no errors.

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "AllocatedBuffer.h"
#include "FdReader.h"
#include "FdWriter.h"
#include "Logger.h"
#include "ProtocolHelper.h"
#include "SensorWire.h"

namespace {

using Clock = std::chrono::steady_clock;

struct QNSOptions {
  std::string mDir;
  unsigned int mReadings = 20000;
  unsigned int mConnections = 2;
  unsigned int mChannels = 2;
  unsigned int mMalformed = 0;
  bool mCutOne = false;
};

struct QNSConnectionResult {
  unsigned int mSent = 0;
  unsigned int mAccepted = 0;
  unsigned int mRefused = 0;
  unsigned int mErrors = 0;
  std::vector<double> mLatenciesUs;
  std::string mFirstError;
};

void usage() {
  fprintf(stderr,
          "usage: qnsensor-feed [-d dir] [-n readings] [-m connections] [-c channels] [-e malformed] [-x]\n");
}

bool parseCount(const char* apText, unsigned int& arValue) {
  char* lpEnd = nullptr;
  const unsigned long lValue = strtoul(apText, &lpEnd, 10);
  if (lpEnd == apText || *lpEnd != '\0' || lValue > 100000000ul) return false;
  arValue = static_cast<unsigned int>(lValue);
  return true;
}

std::string socketPath(const QNSOptions& acrOptions, unsigned int aChannel) {
  return acrOptions.mDir + "/qnsensord." + std::to_string(aChannel) + ".sock";
}

// Connects to the channel's socket, retrying while the service is still starting.
int connectTo(const std::string& acrPath) {
  const auto lDeadline = Clock::now() + std::chrono::seconds(10);
  for (;;) {
    const int lFd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un lAddress = {};
    lAddress.sun_family = AF_UNIX;
    snprintf(lAddress.sun_path, sizeof lAddress.sun_path, "%s", acrPath.c_str());
    if (lFd >= 0 && connect(lFd, reinterpret_cast<sockaddr*>(&lAddress), sizeof lAddress) == 0) return lFd;
    if (lFd >= 0) close(lFd);
    if (Clock::now() > lDeadline) return -1;
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
  }
}

QNCPointer<QNCBuffer> bufferOf(const std::string& acrText) {
  QNCPointer<QNCBuffer> lBuffer(new (std::nothrow)
                                    QNCAllocatedBuffer(static_cast<unsigned int>(acrText.size()), 0),
                                QNPST_Individual, QNPAT_New);
  memcpy(static_cast<unsigned char*>(*lBuffer), acrText.data(), acrText.size());
  return lBuffer;
}

void fail(QNSConnectionResult& arResult, const std::string& acrWhat) {
  if (arResult.mErrors++ == 0) arResult.mFirstError = acrWhat;
}

void runConnection(const QNSOptions& acrOptions, unsigned int aIndex, unsigned int aCount,
                   unsigned int aMalformed, QNSConnectionResult& arResult) {
  const int lFd = connectTo(socketPath(acrOptions, aIndex % acrOptions.mChannels));
  if (lFd < 0)
    return fail(arResult, "cannot connect to " + socketPath(acrOptions, aIndex % acrOptions.mChannels));
  const int lWriteFd = dup(lFd);
  QNCPointer<QNCReader> lReader(new (std::nothrow)
                                    QNCFdReader(lFd, true, QNCFdReader::kDefaultStagingSize, 50),
                                QNPST_Individual, QNPAT_New);
  QNCPointer<QNCWriter> lWriter(new (std::nothrow) QNCFdWriter(lWriteFd), QNPST_Individual, QNPAT_New);
  QNCProtocolHelper lHelper(1, 4096);
  // Malformed readings are spread evenly through the connection's readings.
  const unsigned int lEvery = aMalformed == 0 ? 0 : std::max(1u, aCount / aMalformed);
  unsigned int lMalformedLeft = aMalformed;
  for (unsigned int lSequence = 0; lSequence < aCount; ++lSequence) {
    const bool lMalformed = lEvery != 0 && lMalformedLeft > 0 && lSequence % lEvery == lEvery - 1;
    std::string lBody;
    if (lMalformed) {
      --lMalformedLeft;
      lBody = "sensor-" + std::to_string(aIndex) + " " + std::to_string(lSequence) + " not-a-number";
    } else {
      QNSSensorReading lReading;
      lReading.mSensor = "sensor-" + std::to_string(aIndex) + "-" + std::to_string(lSequence % 4);
      lReading.mSequence = lSequence;
      lReading.mValue = 20.0 + (lSequence % 100) / 10.0;
      lBody = QNFormatReading(lReading);
    }
    const auto lStart = Clock::now();
    try {
      lHelper.write(lWriter, bufferOf(lBody), false);
      ++arResult.mSent;
      if (!lReader->waitForActivity(60000)) return fail(arResult, "no answer within 60 s");
      QNCPointer<QNCBuffer> lAnswerBuffer;
      lHelper.read(lReader, lAnswerBuffer, 0);
      arResult.mLatenciesUs.push_back(
          std::chrono::duration<double, std::micro>(Clock::now() - lStart).count());
      QNSSensorAnswer lAnswer;
      const QNCBuffer& lBytes = *lAnswerBuffer;
      if (!QNParseAnswer(lBytes, lBytes.getLength(), lAnswer)) {
        fail(arResult, "unreadable answer");
      } else if (lAnswer.mSequence != std::to_string(lSequence)) {
        fail(arResult, "answer for sequence " + lAnswer.mSequence + " where " + std::to_string(lSequence) +
                           " was expected");
      } else if (lAnswer.mAccepted == lMalformed) {
        fail(arResult, "reading " + std::to_string(lSequence) +
                           (lMalformed ? " accepted" : " refused: " + lAnswer.mReason));
      } else if (lAnswer.mAccepted) {
        ++arResult.mAccepted;
      } else {
        ++arResult.mRefused;
      }
    } catch (const QNCException& acrFailure) {
      return fail(arResult, std::string("connection failed: ") + acrFailure.what());
    }
  }
}

// Sends a prefix announcing 100 bytes and only 10 of them, then disconnects.
void cutConnection(const QNSOptions& acrOptions) {
  const int lFd = connectTo(socketPath(acrOptions, 0));
  if (lFd < 0) return;
  const unsigned int lAnnounced = 100;
  (void)!write(lFd, &lAnnounced, sizeof lAnnounced);
  (void)!write(lFd, "sensor-cut", 10);
  close(lFd);
}

double percentile(std::vector<double>& arValues, double aFraction) {
  if (arValues.empty()) return 0.0;
  const size_t lIndex = std::min(arValues.size() - 1, static_cast<size_t>(aFraction * arValues.size()));
  std::nth_element(arValues.begin(), arValues.begin() + static_cast<long>(lIndex), arValues.end());
  return arValues[lIndex];
}

}  // namespace

int main(int argc, char** argv) {
  setLogCode(QNLL_Halt | QNLL_Error);  // the client's own library calls log nothing below errors
  QNSOptions lOptions;
  const char* lpLogDir = getenv("QN_LOG_DIR");
  lOptions.mDir = lpLogDir != nullptr ? lpLogDir : "/tmp";
  int lOption = 0;
  while ((lOption = getopt(argc, argv, "d:n:m:c:e:x")) != -1) {
    bool lOk = true;
    switch (lOption) {
      case 'd':
        lOptions.mDir = optarg;
        break;
      case 'n':
        lOk = parseCount(optarg, lOptions.mReadings);
        break;
      case 'm':
        lOk = parseCount(optarg, lOptions.mConnections) && lOptions.mConnections > 0;
        break;
      case 'c':
        lOk = parseCount(optarg, lOptions.mChannels) && lOptions.mChannels > 0;
        break;
      case 'e':
        lOk = parseCount(optarg, lOptions.mMalformed);
        break;
      case 'x':
        lOptions.mCutOne = true;
        break;
      default:
        lOk = false;
    }
    if (!lOk) {
      usage();
      return 2;
    }
  }
  if (optind != argc || lOptions.mMalformed > lOptions.mReadings) {
    usage();
    return 2;
  }

  if (lOptions.mCutOne) cutConnection(lOptions);
  std::vector<QNSConnectionResult> lResults(lOptions.mConnections);
  std::vector<std::thread> lThreads;
  const auto lStart = Clock::now();
  for (unsigned int k = 0; k < lOptions.mConnections; ++k) {
    const unsigned int lCount =
        lOptions.mReadings / lOptions.mConnections + (k < lOptions.mReadings % lOptions.mConnections ? 1 : 0);
    const unsigned int lMalformed = lOptions.mMalformed / lOptions.mConnections +
                                    (k < lOptions.mMalformed % lOptions.mConnections ? 1 : 0);
    lThreads.emplace_back(runConnection, std::cref(lOptions), k, lCount, lMalformed, std::ref(lResults[k]));
  }
  for (auto& lThread : lThreads) lThread.join();
  const double lSeconds = std::chrono::duration<double>(Clock::now() - lStart).count();

  unsigned int lSent = 0, lAccepted = 0, lRefused = 0, lErrors = 0;
  std::vector<double> lLatencies;
  for (auto& lResult : lResults) {
    lSent += lResult.mSent;
    lAccepted += lResult.mAccepted;
    lRefused += lResult.mRefused;
    lErrors += lResult.mErrors;
    if (!lResult.mFirstError.empty()) fprintf(stderr, "qnsensor-feed: %s\n", lResult.mFirstError.c_str());
    lLatencies.insert(lLatencies.end(), lResult.mLatenciesUs.begin(), lResult.mLatenciesUs.end());
  }
  const unsigned int lMissing = lOptions.mReadings - (lAccepted + lRefused);
  if (lRefused != lOptions.mMalformed) lErrors += 1;
  if (lMissing != 0) lErrors += 1;
  const double lRate = lSeconds > 0 ? (lAccepted + lRefused) / lSeconds : 0.0;
  const double lP50 = percentile(lLatencies, 0.50);
  const double lP99 = percentile(lLatencies, 0.99);
  printf("qnsensor-feed: %u readings over %u connections (%u channels)\n", lOptions.mReadings,
         lOptions.mConnections, lOptions.mChannels);
  printf("  answered: %u accepted, %u refused (%u malformed sent), %u missing\n", lAccepted, lRefused,
         lOptions.mMalformed, lMissing);
  printf("  rate: %.0f readings/s over %.2f s\n", lRate, lSeconds);
  printf("  round trip: p50 %.0f us, p99 %.0f us\n", lP50, lP99);
  printf("  errors: %u (%u readings sent)\n", lErrors, lSent);
  printf("figures: readings_per_s=%.1f p50_us=%.1f p99_us=%.1f errors=%u\n", lRate, lP50, lP99, lErrors);
  return lErrors == 0 ? 0 : 1;
}
