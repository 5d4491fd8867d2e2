#pragma once
// QNCSpareNodes: emptied list nodes kept for reuse by a synchronised list or queue (QNCSynchList,
// QNCSynchQueue), so that one in steady use allocates and frees no node per element.
//
// A node that leaves the owner's list gives its element to the caller and stays here, holding an
// empty pointer (it keeps no object alive); the next insertion fills it again. At most kMaxNodes
// are kept: a node beyond that is handed to the caller to be freed after its lock, so a burst
// does not leave its memory behind for good. The owner's element list is never touched apart
// from the node moved in or out, so iterators into it keep their meaning.
//
// Threads: the owner's lock guards the spare nodes. prepare() alone runs without that lock; it
// only reads an atomic count of the spare nodes, as a hint.

#include <atomic>
#include <optional>
#include <utility>

#include "Pointer.h"
#include "QNList.h"
#include "Queueable.h"

class QNCSpareNodes {
 public:
  using Elements = QNCList<QNCPointer<QNCQueueable>>;
  static constexpr unsigned int kMaxNodes = 1024;

  QNCSpareNodes() = default;
  QNCSpareNodes(const QNCSpareNodes&) = delete;
  QNCSpareNodes& operator=(const QNCSpareNodes&) = delete;

  // A node allocated outside the owner's lock, or one that leaves the list to be freed after it.
  // Optional, so that the common case (a spare node at hand, or kept) costs no list at all.
  using Node = std::optional<Elements>;

  // Before the owner's lock: when no spare node was there a moment ago, allocates a node for
  // arElement into arNode (moving the element in), so that the allocation stays outside the
  // lock. Otherwise leaves both alone. Throws QNCNoMemoryEx "Out of Memory" (2), arElement then
  // unchanged. A stale count costs at most one allocation too many (the spare stays) or one
  // under the lock (insert's last case).
  void prepare(QNCPointer<QNCQueueable>& arElement, Node& arNode) const {
    if (mCount.load(std::memory_order_relaxed) != 0) return;
    arNode.emplace();
    arNode->moveToBack(std::move(arElement));
  }

  // Under the owner's lock: inserts an element before aPosition of arList: the node prepared in
  // arNode, or else arElement in a spare node, or else (another thread took the last spare node
  // since prepare) arElement in a node allocated here. Throws QNCNoMemoryEx "Out of Memory" (2)
  // in that last case; arList is then unchanged.
  void insert(Elements& arList, Elements::iterator aPosition, Node& arNode,
              QNCPointer<QNCQueueable>& arElement) {
    if (!arNode) {
      if (!mNodes.isEmpty()) {
        *mNodes.begin() = std::move(arElement);  // the spare's pointer is empty: nothing released
        arList.splice(aPosition, mNodes, mNodes.begin());
        mCount.store(mNodes.numberOfElements(), std::memory_order_relaxed);
        return;
      }
      arNode.emplace();
      arNode->moveToBack(std::move(arElement));
    }
    arList.splice(aPosition, *arNode, arNode->begin());
  }

  // Under the owner's lock: moves the element at aPosition of arList into arElement, which must
  // be empty (so nothing is released under the lock), and removes its node from arList: kept as
  // a spare, or moved into arFreed for the caller to free after the lock.
  void take(Elements& arList, Elements::iterator aPosition, QNCPointer<QNCQueueable>& arElement,
            Node& arFreed) noexcept {
    arElement = std::move(*aPosition);
    if (mNodes.numberOfElements() < kMaxNodes) {
      mNodes.splice(mNodes.begin(), arList, aPosition);
      mCount.store(mNodes.numberOfElements(), std::memory_order_relaxed);
    } else {
      arFreed.emplace();
      arFreed->spliceBack(arList, aPosition);
    }
  }

 private:
  Elements mNodes;                      // guarded by the owner's lock; every element empty
  std::atomic<unsigned int> mCount{0};  // mNodes' size; written under the owner's lock
};
