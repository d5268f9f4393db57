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
  manager.Log(1, "File.cpp", 3, "nobody hears this");

  std::vector<std::string> heard;
  manager.AddLogger(1, [&heard](const std::string& message) { heard.push_back(message); });
  EXPECT_THAT(heard, IsEmpty());
}

TEST(LoggerMgr, TheProcessWideManagerIsNotConfigured) {
  EXPECT_EQ(Singleton<LoggerMgr>::Instance()->Level(), 0U);
}

TEST(LoggerMgr, MessagesAreFormattedAndTaggedWithTheirPlace) {
  LoggerMgr manager;
  std::vector<std::string> heard;
  manager.AddLogger(1, [&heard](const std::string& message) { heard.push_back(message); });
  manager.Log(1, "File.cpp", 3, "%d of %s", 7, "eight");
  EXPECT_THAT(heard, ElementsAre("File.cpp:3: 7 of eight"));
}

TEST(LoggerMgr, OnlyLevelsUpToTheThresholdAreLogged) {
  LoggerMgr manager;
  std::vector<std::string> heard;
  manager.AddLogger(2, [&heard](const std::string& message) { heard.push_back(message); });
  EXPECT_EQ(manager.Level(), 2U);
  manager.Log(3, "f", 1, "three");
  manager.Log(2, "f", 1, "two");
  manager.Log(1, "f", 1, "one");
  EXPECT_THAT(heard, ElementsAre("f:1: two", "f:1: one"));
}

TEST(LoggerMgr, EveryLoggerHearsEveryMessage) {
  LoggerMgr manager;
  std::vector<std::string> heard;
  manager.AddLogger(1, [&heard](const std::string& message) { heard.push_back("1 " + message); });
  manager.AddLogger(1, [&heard](const std::string& message) { heard.push_back("2 " + message); });
  manager.Log(1, "f", 1, "%s", "text");
  EXPECT_THAT(heard, ElementsAre("1 f:1: text", "2 f:1: text"));
}

} // namespace
} // namespace orva::util
