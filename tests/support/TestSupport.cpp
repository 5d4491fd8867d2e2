#include "TestSupport.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "AllocatedBuffer.h"
#include "Os.h"

extern char** environ;

namespace qntest {

TempDir::TempDir() {
  char lTemplate[] = "/tmp/qntest.XXXXXX";
  if (mkdtemp(lTemplate) == nullptr) throw std::runtime_error("mkdtemp failed");
  mPath = lTemplate;
}

TempDir::~TempDir() {
  const std::string lCommand = "rm -rf '" + mPath + "'";
  (void)!system(lCommand.c_str());
}

std::string readFile(const std::string& acrPath) {
  std::ifstream lIn(acrPath, std::ios::binary);
  std::ostringstream lOut;
  lOut << lIn.rdbuf();
  return lOut.str();
}

void writeFile(const std::string& acrPath, const std::string& acrContents) {
  std::ofstream lOut(acrPath, std::ios::binary | std::ios::trunc);
  lOut << acrContents;
}

pid_t spawn(const std::vector<std::string>& acrArgv, const std::vector<std::string>& acrEnv,
            const std::string& acrStdout, const std::string& acrStderr) {
  std::vector<char*> lArgv;
  for (const auto& lArg : acrArgv) lArgv.push_back(const_cast<char*>(lArg.c_str()));
  lArgv.push_back(nullptr);
  // The extra entries first: getenv finds them before an inherited entry of the same name.
  std::vector<std::string> lEnvStore = acrEnv;
  for (char** lpEntry = environ; *lpEntry != nullptr; ++lpEntry) lEnvStore.push_back(*lpEntry);
  std::vector<char*> lEnv;
  for (auto& lEntry : lEnvStore) lEnv.push_back(const_cast<char*>(lEntry.c_str()));
  lEnv.push_back(nullptr);

  posix_spawn_file_actions_t lActions;
  posix_spawn_file_actions_init(&lActions);
  if (!acrStdout.empty())
    posix_spawn_file_actions_addopen(&lActions, 1, acrStdout.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  if (!acrStderr.empty())
    posix_spawn_file_actions_addopen(&lActions, 2, acrStderr.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  pid_t lPid = -1;
  const int lResult = posix_spawn(&lPid, lArgv[0], &lActions, nullptr, lArgv.data(), lEnv.data());
  posix_spawn_file_actions_destroy(&lActions);
  if (lResult != 0) throw std::runtime_error(std::string("posix_spawn failed: ") + strerror(lResult));
  return lPid;
}

int waitExit(pid_t aPid, std::chrono::milliseconds aTimeout) {
  const auto lDeadline = std::chrono::steady_clock::now() + aTimeout;
  for (;;) {
    int lStatus = 0;
    const pid_t lDone = waitpid(aPid, &lStatus, WNOHANG);
    if (lDone == aPid) {
      if (WIFEXITED(lStatus)) return WEXITSTATUS(lStatus);
      if (WIFSIGNALED(lStatus)) return 128 + WTERMSIG(lStatus);
      return -1;
    }
    if (lDone < 0) return -1;
    if (std::chrono::steady_clock::now() > lDeadline) {
      kill(aPid, SIGKILL);
      waitpid(aPid, &lStatus, 0);
      return -1;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
}

bool waitForText(const std::string& acrPath, const std::string& acrText, std::chrono::milliseconds aTimeout) {
  for (const auto lDeadline = std::chrono::steady_clock::now() + aTimeout;;) {
    if (readFile(acrPath).find(acrText) != std::string::npos) return true;
    if (std::chrono::steady_clock::now() > lDeadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
  }
}

size_t countOf(const std::string& acrHaystack, const std::string& acrText) {
  size_t lCount = 0;
  for (size_t lAt = acrHaystack.find(acrText); lAt != std::string::npos;
       lAt = acrHaystack.find(acrText, lAt + acrText.size()))
    ++lCount;
  return lCount;
}

bool lockedByOther(const std::string& acrPath) {
  const int lFd = open(acrPath.c_str(), O_RDONLY);
  if (lFd < 0) return false;
  QNEFileLockStatus lStatus = QNFLS_None;
  OsFileLockStatus(lFd, lStatus);
  close(lFd);
  return lStatus == QNFLS_LockedByOther;
}

QNCPointer<QNCBuffer> bufferOf(const Bytes& acrBytes) {
  const unsigned int lLength = static_cast<unsigned int>(acrBytes.size());
  QNCPointer<QNCBuffer> lBuffer(new (std::nothrow) QNCAllocatedBuffer(lLength == 0 ? 1 : lLength, 0));
  if (lLength != 0) memcpy(static_cast<unsigned char*>(*lBuffer), acrBytes.data(), lLength);
  lBuffer->setLength(lLength);
  return lBuffer;
}

Bytes bytesOf(const QNCPointer<QNCBuffer>& acrBuffer) {
  const unsigned char* lpBytes = *acrBuffer;
  return Bytes(lpBytes, lpBytes + acrBuffer->getLength());
}

std::string builtProgram(const std::string& acrRelativePath) {
  return std::string(QN_TEST_BINARY_DIR) + "/" + acrRelativePath;
}

pid_t spawnHelper(const std::vector<std::string>& acrArgs, const std::string& acrStdout,
                  const std::string& acrStderr, const std::vector<std::string>& acrEnv) {
  std::vector<std::string> lArgv{builtProgram("tests/qn_test_helper")};
  lArgv.insert(lArgv.end(), acrArgs.begin(), acrArgs.end());
  return spawn(lArgv, acrEnv, acrStdout, acrStderr);
}

}  // namespace qntest
