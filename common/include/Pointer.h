#pragma once
// QNCPointer<T>: shared ownership of one object (or one array), with the counter kept outside
// the object, so T needs no counter of its own.
//
// Invariant: either the pointer is empty (all four fields null/0) or mPointer and
// mReferenceCount are both set and the two bytes hold valid values.
//
// - Construction from a raw object takes ownership. A null object (the result of a failed
//   non-throwing new) throws QNCNoMemoryEx "Out of Memory" (2); so does a failure to allocate the
//   counter, after the object has been released.
// - Copying and assigning share the object and never allocate. Copying or assigning FROM an empty
//   pointer is a programming error and asserts. Moving is allowed from any pointer and leaves the
//   source empty; it costs no counter traffic. The source of an assignment may be held by the
//   object the assignment releases ("lHead = lHead->mNext").
// - The last reference destroys the object as it was made: delete, delete[] or free().
// - A QNCPointer<Base> can be made from a QNCPointer<Derived> of a single object; the two share the
//   counter. Base needs a virtual destructor.
//
// Threads: a QNCPointer value is used by one thread at a time; different copies of one pointer
// may be used and released on different threads (the counter is atomic).

#include <cstdlib>
#include <new>
#include <type_traits>

#include "Assert.h"
#include "QNException.h"
#include "ReferenceCount.h"

enum QNEPointerSizeType : unsigned char {
  QNPST_Individual = 1,  // one object made with new (or malloc)
  QNPST_Array = 2,       // an array made with new[]
};

enum QNEPointerAllocationType : unsigned char {
  QNPAT_New = 1,     // released with delete or delete[]
  QNPAT_Malloc = 2,  // released with free()
};

template <class T>
class QNCPointer {
 public:
  constexpr QNCPointer() noexcept
      : mPointer(nullptr), mReferenceCount(nullptr), mSizeType(0), mAllocationType(0) {}

  // Takes ownership of apObject. Throws QNCNoMemoryEx "Out of Memory" (2) when apObject is null
  // or when the counter cannot be allocated.
  explicit QNCPointer(T* apObject, QNEPointerSizeType aSizeType = QNPST_Individual,
                      QNEPointerAllocationType aAllocationType = QNPAT_New)
      : mPointer(apObject), mReferenceCount(nullptr), mSizeType(aSizeType), mAllocationType(aAllocationType) {
    if (apObject == nullptr) {
      mSizeType = 0;
      mAllocationType = 0;
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
    mReferenceCount = new (std::nothrow) QNCReferenceCount(1);
    if (mReferenceCount == nullptr) {
      _releaseObject();
      mSizeType = 0;
      mAllocationType = 0;
      throw QNCNoMemoryEx("Out of Memory", 2);
    }
  }

  QNCPointer(const QNCPointer& acrCopy) noexcept
      : mPointer(acrCopy.mPointer),
        mReferenceCount(acrCopy.mReferenceCount),
        mSizeType(acrCopy.mSizeType),
        mAllocationType(acrCopy.mAllocationType) {
    QN_ASSERT(0 != acrCopy.mPointer);
    QN_ASSERT(0 != acrCopy.mReferenceCount);
    mReferenceCount->increment();
  }

  // Shares a single object of a derived class.
  template <class U,
            class = std::enable_if_t<std::is_convertible<U*, T*>::value && !std::is_same<U, T>::value>>
  QNCPointer(const QNCPointer<U>& acrCopy) noexcept
      : mPointer(acrCopy.mPointer),
        mReferenceCount(acrCopy.mReferenceCount),
        mSizeType(acrCopy.mSizeType),
        mAllocationType(acrCopy.mAllocationType) {
    // The last reference may be this one, and delete through a base without a virtual
    // destructor would skip the derived part.
    static_assert(std::is_same<std::remove_cv_t<T>, std::remove_cv_t<U>>::value ||
                      std::has_virtual_destructor<T>::value,
                  "a QNCPointer to a base class needs a virtual destructor in the base");
    QN_ASSERT(0 != acrCopy.mPointer);
    QN_ASSERT(0 != acrCopy.mReferenceCount);
    QN_ASSERT(QNPST_Individual == acrCopy.mSizeType);
    mReferenceCount->increment();
  }

  QNCPointer(QNCPointer&& arOther) noexcept
      : mPointer(arOther.mPointer),
        mReferenceCount(arOther.mReferenceCount),
        mSizeType(arOther.mSizeType),
        mAllocationType(arOther.mAllocationType) {
    arOther._clear();
  }

  ~QNCPointer() {
    _release();
    _clear();
  }

  QNCPointer& operator=(const QNCPointer& acrCopy) noexcept {
    QN_ASSERT(0 != acrCopy.mPointer);
    QN_ASSERT(0 != acrCopy.mReferenceCount);
    if (this == &acrCopy) return *this;
    // The source may live inside the object that this pointer releases ("lHead = lHead->mNext"),
    // so its fields are read and its reference taken before the release. Taking the reference
    // first also keeps the object alive when both pointers already share it.
    acrCopy.mReferenceCount->increment();
    _replaceWith(acrCopy.mPointer, acrCopy.mReferenceCount, acrCopy.mSizeType, acrCopy.mAllocationType);
    return *this;
  }

  QNCPointer& operator=(QNCPointer&& arOther) noexcept {
    if (this == &arOther) return *this;
    T* const lpPointer = arOther.mPointer;
    QNCReferenceCount* const lpReferenceCount = arOther.mReferenceCount;
    const unsigned char lSizeType = arOther.mSizeType;
    const unsigned char lAllocationType = arOther.mAllocationType;
    // Emptied before the release, which may destroy the object that holds arOther.
    arOther._clear();
    _replaceWith(lpPointer, lpReferenceCount, lSizeType, lAllocationType);
    return *this;
  }

  T* operator->() const noexcept {
    QN_ASSERT(0 != mPointer);
    QN_ASSERT(0 != mReferenceCount);
    QN_ASSERT(QNPST_Individual == mSizeType);
    return mPointer;
  }

  T& operator*() const noexcept {
    QN_ASSERT(0 != mPointer);
    QN_ASSERT(0 != mReferenceCount);
    if (mSizeType != QNPST_Individual && mSizeType != QNPST_Array) QN_ASSERT(false);
    return *mPointer;
  }

  bool operator!=(const T* apOther) const noexcept { return mPointer != apOther; }
  bool operator==(const T* apOther) const noexcept { return mPointer == apOther; }

  // The raw address (null when empty), for down-casts and comparisons; ownership stays here.
  T* get() const noexcept { return mPointer; }
  bool isNull() const noexcept { return mPointer == nullptr; }

  // True when this pointer holds the only reference to its object (false when empty). Nobody
  // else can reach the object then, and nobody can gain a reference but by copying this pointer,
  // so its holder may reuse the object as it likes.
  bool isSoleOwner() const noexcept { return mReferenceCount != nullptr && mReferenceCount->isOne(); }

  // Drops this reference; the pointer becomes empty.
  void reset() noexcept {
    _release();
    _clear();
  }

 private:
  template <class U>
  friend class QNCPointer;

  // Releases this reference and takes over the given fields, whose reference is already counted.
  // The arguments are values, so they stay valid when the release destroys their origin.
  void _replaceWith(T* apPointer, QNCReferenceCount* apReferenceCount, unsigned char aSizeType,
                    unsigned char aAllocationType) noexcept {
    _release();
    mPointer = apPointer;
    mReferenceCount = apReferenceCount;
    mSizeType = aSizeType;
    mAllocationType = aAllocationType;
  }

  void _clear() noexcept {
    mPointer = nullptr;
    mReferenceCount = nullptr;
    mSizeType = 0;
    mAllocationType = 0;
  }

  void _release() noexcept {
    if (mPointer != nullptr && mReferenceCount != nullptr && mReferenceCount->decrement() == 0)
      _releaseMemory();
  }

  // The last reference is gone: free the counter, then the object as it was allocated.
  void _releaseMemory() noexcept {
    delete mReferenceCount;
    mReferenceCount = nullptr;
    _releaseObject();
    mPointer = nullptr;
  }

  void _releaseObject() noexcept {
    if (mAllocationType == QNPAT_New) {
      if (mSizeType == QNPST_Individual) {
        delete mPointer;
      } else if (mSizeType == QNPST_Array) {
        delete[] mPointer;
      } else {
        QN_ASSERT(false);
      }
    } else if (mAllocationType == QNPAT_Malloc) {
      free(const_cast<std::remove_const_t<T>*>(mPointer));
    } else {
      QN_ASSERT(false);
    }
  }

  T* mPointer;
  QNCReferenceCount* mReferenceCount;
  unsigned char mSizeType;
  unsigned char mAllocationType;
};
