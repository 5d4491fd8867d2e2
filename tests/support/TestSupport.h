#pragma once
// Helpers for tests that work with real files and real processes.

#include <sys/types.h>

#include <chrono>
#include <string>
#include <utility>
#include <vector>

#include "Buffer.h"
#include "Pointer.h"

namespace qntest {

// A fresh directory under /tmp, removed with its contents by the destructor.
class TempDir {
 public:
  TempDir();
  ~TempDir();
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;
  const std::string& path() const { return mPath; }
  std::string file(const std::string& acrName) const { return mPath + "/" + acrName; }

 private:
  std::string mPath;
};

// The whole file ("" when it cannot be read).
std::string readFile(const std::string& acrPath);
void writeFile(const std::string& acrPath, const std::string& acrContents);

// Starts a program with the given arguments (argv[0] included) and extra "NAME=value" entries
// added to the environment; its standard output and error go to the given files (or are kept
// when empty). Returns the child's pid.
pid_t spawn(const std::vector<std::string>& acrArgv, const std::vector<std::string>& acrEnv = {},
            const std::string& acrStdout = "", const std::string& acrStderr = "");

// Waits for the child and returns its exit status, or 128 + the signal that ended it, or -1 when
// it did not end within the time-out (it is then killed with SIGKILL and reaped).
int waitExit(pid_t aPid, std::chrono::milliseconds aTimeout = std::chrono::seconds(20));

// A started process, killed (SIGKILL) and reaped when the object goes unless exit() has reaped
// it: a test that fails half-way leaves nothing running behind it.
class Child {
 public:
  explicit Child(pid_t aPid = -1) : mPid(aPid) {}
  Child(Child&& arOther) noexcept : mPid(arOther.mPid) { arOther.mPid = -1; }
  Child& operator=(Child&& arOther) noexcept {
    std::swap(mPid, arOther.mPid);
    return *this;
  }
  ~Child() {
    if (mPid > 0) waitExit(mPid, std::chrono::milliseconds(0));
  }
  pid_t pid() const { return mPid; }
  // waitExit's result; the process is reaped in any case.
  int exit(std::chrono::milliseconds aTimeout = std::chrono::seconds(20)) {
    const pid_t lPid = mPid;
    mPid = -1;
    return waitExit(lPid, aTimeout);
  }

 private:
  pid_t mPid;
};

// Polls until the file contains the text, or the time-out passes.
bool waitForText(const std::string& acrPath, const std::string& acrText,
                 std::chrono::milliseconds aTimeout = std::chrono::seconds(10));

// The path of a program built beside the tests (relative to the build directory).
std::string builtProgram(const std::string& acrRelativePath);
// Starts tests/qn_test_helper (tests/programs/TestHelper.cpp) with the mode and its arguments.
pid_t spawnHelper(const std::vector<std::string>& acrArgs, const std::string& acrStdout = "",
                  const std::string& acrStderr = "", const std::vector<std::string>& acrEnv = {});

// How often acrText occurs in acrHaystack (occurrences may not overlap).
size_t countOf(const std::string& acrHaystack, const std::string& acrText);

// Whether a fresh open of the file sees its lock held (open-file-description locks conflict
// between opens even within one process, so this is what another process would see).
bool lockedByOther(const std::string& acrPath);

// A buffer holding exactly the bytes, and the bytes a buffer holds up to its used length.
using Bytes = std::vector<unsigned char>;
QNCPointer<QNCBuffer> bufferOf(const Bytes& acrBytes);
Bytes bytesOf(const QNCPointer<QNCBuffer>& acrBuffer);

// The message of the exception E that acrCall throws, followed by " (code N)" when aWithCode;
// "(nothing thrown)" when the call returns. An exception of another class passes through.
template <class E, class Call>
std::string thrown(const Call& acrCall, bool aWithCode = false) {
  try {
    acrCall();
  } catch (const E& acrException) {
    const std::string lMessage = acrException.what();
    return aWithCode ? lMessage + " (code " + std::to_string(acrException.getCode()) + ")" : lMessage;
  }
  return "(nothing thrown)";
}

}  // namespace qntest
