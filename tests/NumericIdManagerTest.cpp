#include <gtest/gtest.h>

#include <string>

#include "NumericIdManager.h"
#include "QNException.h"
#include "TestSupport.h"

namespace {

TEST(NumericIdManagerTest, StartsAtOneAndReusesReturnedIdsFirstInReturnOrder) {
  QNCNumericIdManager lManager;
  unsigned int lId = 0;
  for (unsigned int lExpected = 1; lExpected <= 5; ++lExpected) {
    lManager.getNextId(lId);
    EXPECT_EQ(lExpected, lId);
  }
  lManager.markForReuse(4);
  lManager.markForReuse(2);
  lManager.getNextId(lId);
  EXPECT_EQ(4u, lId);
  lManager.getNextId(lId);
  EXPECT_EQ(2u, lId);
  lManager.getNextId(lId);
  EXPECT_EQ(6u, lId);
}

TEST(NumericIdManagerTest, ReturningAnIdNotInUseIsRefused) {
  QNCNumericIdManager lManager;
  unsigned int lId = 0;
  lManager.getNextId(lId);
  lManager.getNextId(lId);

  for (unsigned int lNeverIssued : {0u, 3u, 4294967295u}) {
    EXPECT_EQ("Numeric identifier " + std::to_string(lNeverIssued) + " is not in use, cannot return it",
              qntest::thrown<QNCInvalidEx>([&] { lManager.markForReuse(lNeverIssued); }));
  }
  // A double return would later hand 1 to two users at once.
  lManager.markForReuse(1);
  EXPECT_THROW(lManager.markForReuse(1), QNCInvalidEx);
  lManager.getNextId(lId);
  EXPECT_EQ(1u, lId);
  lManager.getNextId(lId);
  EXPECT_EQ(3u, lId) << "1 was queued twice";
}

// Bounds of 3 and 0: the bound is the last identifier handed out, and a return frees one.
TEST(NumericIdManagerTest, ExhaustionThrowsInsteadOfWrappingAndRecoversAfterAReturn) {
  QNCNumericIdManager lManager(3);
  unsigned int lId = 0;
  for (int lCount = 0; lCount < 3; ++lCount) lManager.getNextId(lId);
  lId = 77;
  EXPECT_EQ("No numeric identifier is free: all of 1..3 are in use",
            qntest::thrown<QNCNotFoundEx>([&] { lManager.getNextId(lId); }));
  EXPECT_EQ(77u, lId);
  lManager.markForReuse(2);
  lManager.getNextId(lId);
  EXPECT_EQ(2u, lId);
  EXPECT_THROW(lManager.getNextId(lId), QNCNotFoundEx);

  QNCNumericIdManager lEmpty(0);
  EXPECT_THROW(lEmpty.getNextId(lId), QNCNotFoundEx);
}

}  // namespace
