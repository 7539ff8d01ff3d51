#include "tools/StatusText.h"

#include <gtest/gtest.h>

#include "interfaces/AgentKeys.h"

namespace telvane::testing {
namespace {

TEST(StatusTextTest, writesOneLinePerFact) {
  Dictionary clientTypes;
  clientTypes.set("7 CONFERENCE", 2);
  Dictionary storebags;
  storebags.set("conferencing", Dictionary{{kStatusStorebagState, "Fetch Successful"},
                                           {kStatusStorebagVersion, "demo-1"},
                                           {kStatusStorebagAgeSeconds, 3},
                                           {kStatusStorebagMaxAgeSeconds, 600}});
  const Dictionary status{{kStatusVersion, "1.0"},       {kStatusProcessID, 42},   {kStatusUptimeSeconds, 9},
                          {kStatusMemoryBytes, 3200000}, {kStatusSessions, 3},     {kStatusClientTypes, clientTypes},
                          {kStatusHierarchies, 1},       {kStatusTransactions, 5}, {kStatusConnectivityHelpers, 2},
                          {kStatusStorebags, storebags}};
  EXPECT_EQ(statusText(status),
            "telvaned 1.0, pid 42, up 9 s, 3.2 MB\n"
            "sessions: 3\n"
            "  7 CONFERENCE                2\n"
            "hierarchies: 1\n"
            "transactions: 5\n"
            "connectivity helpers: 2\n"
            "storebags:\n"
            "  conferencing                version demo-1, 3 s old, fresh for 600 s, Fetch Successful");
}

TEST(StatusTextTest, bearsAStatusOfAnotherShape) {
  const std::string empty = statusText({});
  EXPECT_NE(empty.find("storebags: none"), std::string::npos) << empty;
  const Dictionary odd{{kStatusVersion, 5},
                       {kStatusSessions, "x"},
                       {kStatusClientTypes, Array{1}},
                       {kStatusStorebags, Dictionary{{kStatusVersion, "no record"}}}};
  EXPECT_NE(statusText(odd).find("sessions: 0"), std::string::npos) << statusText(odd);
}

}  // namespace
}  // namespace telvane::testing
