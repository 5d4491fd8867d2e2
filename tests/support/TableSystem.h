#pragma once
// The one minimal system object of the tests and the helper program: the three operations every
// application must provide (no options, no configuration file, no help), numbered tables filled
// the way an application's system class does (threads included), the conditionals themselves so
// tests can take a conditional's lock directly, and on request an instance manager on a given PID
// file. Beside it, the scripted thread component the thread tests share.

#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <new>
#include <thread>

#include "Conditional.h"
#include "ProcessInstanceManager.h"
#include "QNException.h"
#include "SynchList.h"
#include "SynchQueue.h"
#include "System.h"
#include "ThreadComponent.h"
#include "ThreadPool.h"

namespace qntest {

// An element that knows its number and counts its destructions in a counter the test owns.
class Item : public QNCQueueable {
 public:
  explicit Item(int aId, std::atomic<int>* apDestroyed = nullptr) : mId(aId), mpDestroyed(apDestroyed) {}
  ~Item() override {
    if (mpDestroyed != nullptr) mpDestroyed->fetch_add(1);
  }
  int mId;

 private:
  std::atomic<int>* mpDestroyed;
};

inline QNCPointer<QNCQueueable> makeItem(int aId, std::atomic<int>* apDestroyed = nullptr) {
  return QNCPointer<QNCQueueable>(new (std::nothrow) Item(aId, apDestroyed));
}

inline int idOf(const QNCPointer<QNCQueueable>& acrElement) {
  return static_cast<Item*>(acrElement.get())->mId;
}

// Polls acrCondition until it holds or acLimit passes; says whether it held.
inline bool eventually(const std::function<bool()>& acrCondition,
                       std::chrono::milliseconds acLimit = std::chrono::seconds(10)) {
  const auto lDeadline = std::chrono::steady_clock::now() + acLimit;
  while (!acrCondition()) {
    if (std::chrono::steady_clock::now() > lDeadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  return true;
}

// Runs acrCall on a thread of its own and reports whether it returned within acLimit, so that a
// fault shows as a failed expectation instead of a hung test program. When the call is late,
// acrRelease (if given) must unblock it and the thread is joined; without one the thread is
// taken to be deadlocked and is left behind, detached.
inline bool returnsWithin(const std::function<void()>& acrCall, std::chrono::milliseconds acLimit,
                          const std::function<void()>& acrRelease = {}) {
  auto lDone = std::make_shared<std::promise<void>>();
  std::future<void> lFinished = lDone->get_future();
  std::thread lThread([acrCall, lDone] {
    acrCall();
    lDone->set_value();
  });
  const bool lInTime = lFinished.wait_for(acLimit) == std::future_status::ready;
  if (lInTime || acrRelease) {
    if (!lInTime) acrRelease();
    lThread.join();
  } else {
    lThread.detach();
  }
  return lInTime;
}

// A thread component whose body the test gives (by default: wait for the exit request). It
// counts its runs, may refuse exit requests (mRefuse runs first and may throw) or restart after
// a failure, and joins in its own destructor, before its members go, unless told to leave that to
// the base destructor.
class ScriptedComponent : public QNCThreadComponent {
 public:
  using Body = std::function<void(ScriptedComponent&)>;
  explicit ScriptedComponent(Body aBody = {}, const char* apName = "scripted", bool aJoin = true)
      : QNCThreadComponent(apName), mBody(std::move(aBody)), mJoin(aJoin) {}
  ~ScriptedComponent() override {
    if (mJoin) waitForExit();
  }
  void requestExit() override {
    if (mRefuse) mRefuse();
    QNCThreadComponent::requestExit();
  }
  using QNCThreadComponent::waitForExitRequest;

  std::function<void()> mRefuse;  // set before init()
  bool mRestart = false;          // set before init()
  std::atomic<int> mRuns{0};

 protected:
  void run() override {
    ++mRuns;
    if (mBody) return mBody(*this);
    while (!waitForExitRequest(3600u * 1000u)) {
    }
  }
  bool restartAfterFailure(const char* apWhat) override {
    return mRestart || QNCThreadComponent::restartAfterFailure(apWhat);
  }

 private:
  Body mBody;
  bool mJoin;
};

class TableSystem : public QNCSystem {
 public:
  TableSystem(unsigned int aConditionals = 0, unsigned int aQueues = 0, unsigned int aLists = 0) {
    mName = "qntest";
    for (unsigned int lIndex = 0; lIndex < aConditionals; ++lIndex)
      mWaitConditionals.append(QNCPointer<QNCConditional>(new (std::nothrow) QNCConditional));
    for (unsigned int lIndex = 0; lIndex < aQueues; ++lIndex)
      mQueues.append(QNCPointer<QNCSynchQueue>(new (std::nothrow) QNCSynchQueue));
    for (unsigned int lIndex = 0; lIndex < aLists; ++lIndex)
      mLists.append(QNCPointer<QNCSynchList>(new (std::nothrow) QNCSynchList));
  }

  // Tables are filled before any thread uses them, as the contract requires.
  void addQueue(const QNCPointer<QNCSynchQueue>& acrQueue) { mQueues.append(acrQueue); }

  void addBucket(unsigned int aLength) { mMemoryBufferList.pushBack(aLength); }
  template <class T>
  T& addComponent(T* apComponent) {
    mThreadComponents.append(QNCPointer<QNCThreadComponent>(apComponent));
    return *apComponent;
  }
  QNCThreadPool& addPool(const char* apName, unsigned int aThreads) {
    mThreadPools.append(QNCPointer<QNCThreadPool>(new QNCThreadPool(apName, aThreads)));
    return *mThreadPools[mThreadPools.numberOfElements() - 1];
  }
  void usePidFile(const char* apPath) {
    mProcessInstanceManager =
        QNCPointer<QNCProcessInstanceManager>(new (std::nothrow) QNCProcessInstanceManager(apPath));
  }

  QNCConditional& conditional(unsigned int aNumber) { return *mWaitConditionals[aNumber]; }

  void setCommandLineArgumentDesc() override {}
  void parseConfigFile(QNCString&) override { throw QNCNotImplementedEx("no config file", 0); }
  void displayHelp() override {}
};

}  // namespace qntest
