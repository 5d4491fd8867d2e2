#include <gtest/gtest.h>

#include <string>

#include "NumericIdManager.h"
#include "QNException.h"

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
    try {
      lManager.markForReuse(lNeverIssued);
      ADD_FAILURE() << lNeverIssued << " was accepted";
    } catch (const QNCInvalidEx& acrException) {
      EXPECT_EQ("Numeric identifier " + std::to_string(lNeverIssued) + " is not in use, cannot return it",
                std::string(acrException.what()));
    }
  }
  // A double return would later hand 1 to two users at once.
  lManager.markForReuse(1);
  EXPECT_THROW(lManager.markForReuse(1), QNCInvalidEx);
  lManager.getNextId(lId);
  EXPECT_EQ(1u, lId);
  lManager.getNextId(lId);
  EXPECT_EQ(3u, lId) << "1 was queued twice";
}

TEST(NumericIdManagerTest, ExhaustionThrowsInsteadOfWrappingAndRecoversAfterAReturn) {
  QNCNumericIdManager lManager(3);
  unsigned int lId = 0;
  for (int lCount = 0; lCount < 3; ++lCount) lManager.getNextId(lId);
  lId = 77;
  try {
    lManager.getNextId(lId);
    ADD_FAILURE() << "a fourth identifier was handed out: " << lId;
  } catch (const QNCNotFoundEx& acrException) {
    EXPECT_STREQ("No numeric identifier is free: all of 1..3 are in use", acrException.what());
  }
  EXPECT_EQ(77u, lId);
  lManager.markForReuse(2);
  lManager.getNextId(lId);
  EXPECT_EQ(2u, lId);
  EXPECT_THROW(lManager.getNextId(lId), QNCNotFoundEx);
}

TEST(NumericIdManagerTest, BoundsOfOneAndZeroAreHonoured) {
  QNCNumericIdManager lManager(1);
  unsigned int lId = 0;
  lManager.getNextId(lId);
  EXPECT_EQ(1u, lId);
  EXPECT_THROW(lManager.getNextId(lId), QNCNotFoundEx);
  QNCNumericIdManager lEmpty(0);
  EXPECT_THROW(lEmpty.getNextId(lId), QNCNotFoundEx);
}

}  // namespace
