#pragma once
// The shared counter behind QNCPointer. increment() and decrement() are atomic, so copies of one
// pointer may be made and released on different threads at the same time.

#include <atomic>

class QNCReferenceCount {
 public:
  explicit QNCReferenceCount(unsigned int aInitial) noexcept : mCount(aInitial) {}
  QNCReferenceCount(const QNCReferenceCount&) = delete;
  QNCReferenceCount& operator=(const QNCReferenceCount&) = delete;
  ~QNCReferenceCount() = default;

  void increment() noexcept { mCount.fetch_add(1, std::memory_order_relaxed); }

  // Returns the new count. The release/acquire pair makes every write to the shared object by
  // other holders visible to the thread that sees 0 and destroys it.
  unsigned int decrement() noexcept { return mCount.fetch_sub(1, std::memory_order_acq_rel) - 1; }

  unsigned int get() const noexcept { return mCount.load(std::memory_order_relaxed); }

  // True when the count is 1. Acquire, paired with decrement()'s release: everything the other
  // holders did with the shared object happens before what the caller does with it next.
  bool isOne() const noexcept { return mCount.load(std::memory_order_acquire) == 1; }

 private:
  std::atomic<unsigned int> mCount;
};
