#include "RunStatus.h"

#include <atomic>

namespace {
std::atomic<bool> gsRunFailed{false};
std::atomic<void (*)()> gspExitRequest{nullptr};
}  // namespace

void QNFailRun() {
  gsRunFailed.store(true);
  void (*const lpRequest)() = gspExitRequest.load();
  if (lpRequest != nullptr) lpRequest();
}

bool QNHasRunFailed() noexcept { return gsRunFailed.load(std::memory_order_relaxed); }

void QNSetExitRequest(void (*apRequest)()) { gspExitRequest.store(apRequest); }
