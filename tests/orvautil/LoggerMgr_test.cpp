#include "orvautil/LoggerMgr.h"
#include "orvautil/Singleton.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace orva::util {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

TEST(LoggerMgr, LogsNothingUntilALoggerIsAdded) {
  LoggerMgr manager;
  EXPECT_EQ(manager.Level(), 0U);
  manager.Log(1, "File.cpp", 3, "dropped");

  std::vector<std::string> logged;
  manager.AddLogger(1, [&logged](const std::string& message) { logged.push_back(message); });
  EXPECT_THAT(logged, IsEmpty());
}

TEST(LoggerMgr, TheProcessWideManagerIsNotConfigured) {
  EXPECT_EQ(Singleton<LoggerMgr>::Instance()->Level(), 0U);
}

TEST(LoggerMgr, MessagesAreFormattedAndTaggedWithTheirPlace) {
  LoggerMgr manager;
  std::vector<std::string> logged;
  manager.AddLogger(1, [&logged](const std::string& message) { logged.push_back(message); });
  manager.Log(1, "File.cpp", 3, "%d of %s", 7, "eight");
  EXPECT_THAT(logged, ElementsAre("File.cpp:3: 7 of eight"));
}

TEST(LoggerMgr, OnlyLevelsUpToTheThresholdAreLogged) {
  LoggerMgr manager;
  std::vector<std::string> logged;
  manager.AddLogger(2, [&logged](const std::string& message) { logged.push_back(message); });
  EXPECT_EQ(manager.Level(), 2U);
  manager.Log(3, "f", 1, "three");
  manager.Log(2, "f", 1, "two");
  manager.Log(1, "f", 1, "one");
  EXPECT_THAT(logged, ElementsAre("f:1: two", "f:1: one"));
}

TEST(LoggerMgr, EveryLoggerGetsEveryMessage) {
  LoggerMgr manager;
  std::vector<std::string> logged;
  manager.AddLogger(1, [&logged](const std::string& message) { logged.push_back("1 " + message); });
  manager.AddLogger(1, [&logged](const std::string& message) { logged.push_back("2 " + message); });
  manager.Log(1, "f", 1, "%s", "text");
  EXPECT_THAT(logged, ElementsAre("1 f:1: text", "2 f:1: text"));
}

} // namespace
} // namespace orva::util
