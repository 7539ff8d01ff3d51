#include "bench/FigureTable.h"

#include <gtest/gtest.h>

namespace telvane::bench {
namespace {

TEST(FigureTableTest, showsMedianRangeAndGoalOfSeveralSamples) {
  FigureTable table;
  table.add({"ratio", Samples({1.6, 1.2, 1.3}), "", 2, Goal{Goal::Kind::AtMost, 1.5}});
  EXPECT_EQ(table.text(),
            "| what  | median | range        | goal         |     |\n"
            "|-------|--------|--------------|--------------|-----|\n"
            "| ratio | 1.30   | 1.20 to 1.60 | at most 1.50 | met |\n");
}

TEST(FigureTableTest, saysWhichGoalIsMissed) {
  FigureTable table;
  table.add({"rate", Samples({99}), " /s", 0, Goal{Goal::Kind::AtLeast, 100}});
  EXPECT_EQ(table.text(),
            "| what | median | range | goal            |        |\n"
            "|------|--------|-------|-----------------|--------|\n"
            "| rate | 99 /s  |       | at least 100 /s | missed |\n");
}

TEST(FigureTableTest, aGoalIsMetByItsLimit) {
  EXPECT_TRUE((Goal{Goal::Kind::AtMost, 0}).isMetBy(0));
  EXPECT_FALSE((Goal{Goal::Kind::AtMost, 0}).isMetBy(0.1));
  EXPECT_TRUE((Goal{Goal::Kind::AtLeast, 5}).isMetBy(5));
  EXPECT_FALSE((Goal{Goal::Kind::AtLeast, 5}).isMetBy(4.9));
}

TEST(FigureTableTest, notesStandUnderTheTable) {
  FigureTable table;
  table.add("events", "3 of 3", "all", true);
  table.addNote("On two cores.");
  EXPECT_EQ(table.text(),
            "| what   | median | range | goal |     |\n"
            "|--------|--------|-------|------|-----|\n"
            "| events | 3 of 3 |       | all  | met |\n"
            "\nOn two cores.\n");
}

}  // namespace
}  // namespace telvane::bench
