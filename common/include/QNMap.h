#pragma once
// QNCMap<K,V>: an ordered map whose misuse is reported through the exception family.
//   get of a missing key -> info line "Element does not exist in the map", then
//                           QNCNotFoundEx "No element for the key exists in map" (8)
//   insert of a present key -> error line "Element already existed in the map", then
//                           QNCExistsEx "Element already exists in map.. can't insert" (10);
//                           the old value stays (there is no replace-on-insert)
//   allocation failure   -> QNCNoMemoryEx "Out of Memory" (2)
// Threads: one thread at a time, or many readers while nobody writes.

#include <map>
#include <new>

#include "Logger.h"
#include "QNException.h"

template <class K, class V>
class QNCMap {
 public:
  V& get(const K& acrKey) { return const_cast<V&>(static_cast<const QNCMap&>(*this).get(acrKey)); }

  const V& get(const K& acrKey) const {
    auto lFound = mMap.find(acrKey);
    if (lFound == mMap.end()) {
      QN_LOG_INFO("Element does not exist in the map");
      throw QNCNotFoundEx("No element for the key exists in map", 8);
    }
    return lFound->second;
  }

  void insert(const K& acrKey, const V& acrValue) {
    if (!QNNoMemoryToException([&] { return mMap.emplace(acrKey, acrValue).second; })) {
      QN_LOG_ERROR("Element already existed in the map");
      throw QNCExistsEx("Element already exists in map.. can't insert", 10);
    }
  }

  bool contains(const K& acrKey) const { return mMap.find(acrKey) != mMap.end(); }
  unsigned int numberOfElements() const noexcept { return static_cast<unsigned int>(mMap.size()); }

 private:
  std::map<K, V> mMap;
};
