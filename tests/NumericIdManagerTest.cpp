#include <gtest/gtest.h>

#include <string>

#include "NumericIdManager.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

// The identifier getNextId() hands out.
unsigned int nextId(QNCNumericIdManager& arManager) {
  unsigned int lId = 0;
  arManager.getNextId(lId);
  return lId;
}

TEST(NumericIdManagerTest, StartsAtOneReusesReturnedIdsFirstAndRefusesIdsNotInUse) {
  QNCNumericIdManager lManager;
  for (unsigned int lExpected = 1; lExpected <= 5; ++lExpected) EXPECT_EQ(lExpected, nextId(lManager));
  lManager.markForReuse(4);
  lManager.markForReuse(2);
  EXPECT_EQ(4u, nextId(lManager));
  EXPECT_EQ(2u, nextId(lManager));
  EXPECT_EQ(6u, nextId(lManager));

  for (unsigned int lNeverIssued : {0u, 7u, 4294967295u}) {
    EXPECT_EQ("Numeric identifier " + std::to_string(lNeverIssued) + " is not in use, cannot return it",
              qntest::thrown<QNCInvalidEx>([&] { lManager.markForReuse(lNeverIssued); }));
  }
  // A double return would later hand 1 to two users at once.
  lManager.markForReuse(1);
  EXPECT_THROW(lManager.markForReuse(1), QNCInvalidEx);
  EXPECT_EQ(1u, nextId(lManager));
  EXPECT_EQ(7u, nextId(lManager)) << "1 was queued twice";
}

// Bounds of 3 and 0: the bound is the last identifier handed out, and a return frees one.
TEST(NumericIdManagerTest, ExhaustionThrowsInsteadOfWrappingAndRecoversAfterAReturn) {
  QNCNumericIdManager lManager(3);
  for (int lCount = 0; lCount < 3; ++lCount) nextId(lManager);
  unsigned int lId = 77;
  EXPECT_EQ("No numeric identifier is free: all of 1..3 are in use",
            qntest::thrown<QNCNotFoundEx>([&] { lManager.getNextId(lId); }));
  EXPECT_EQ(77u, lId);
  lManager.markForReuse(2);
  EXPECT_EQ(2u, nextId(lManager));
  EXPECT_THROW(lManager.getNextId(lId), QNCNotFoundEx);

  QNCNumericIdManager lEmpty(0);
  EXPECT_THROW(lEmpty.getNextId(lId), QNCNotFoundEx);
}

}  // namespace
