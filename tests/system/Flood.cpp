#include "Flood.h"

#include "support/Programs.h"
#include "support/TestScale.h"

#include <algorithm>

namespace orva::test {

using ::testing::AnyOf;
using ::testing::StartsWith;

namespace {

constexpr long GROWTH_LIMIT = 8192; ///< KiB

} // namespace

std::string Repeated(const std::string& text, std::size_t count) {
  std::string repeated;
  repeated.reserve(text.size() * count);
  for (std::size_t i = 0; i < count; ++i) {
    repeated += text;
  }
  return repeated;
}

std::string Filled(const std::string& head, const std::string& piece, const std::string& tail) {
  std::string message = head;
  while (message.size() + piece.size() + tail.size() <= LONGEST) {
    message += piece;
  }
  return message + tail;
}

void Flood::SetUp() {
  appliance.Start();
  EXPECT_EQ(HANDLED.back(), appliance.Handle(GOOD).back());
  memory_ = std::make_unique<PeakMemory>(appliance.Daemon().Pid());
}

std::string Flood::Refused(const std::string& message) {
  const Log log = appliance.Handle(message);
  EXPECT_GE(1U, log.size()) << ::testing::PrintToString(log);
  if (log.empty()) {
    return "";
  }
  EXPECT_EQ(Error("").priority, log[0].priority);
  EXPECT_THAT(log[0].text,
              AnyOf(StartsWith("MessageProcessor:: "), StartsWith("ERROR ! Node name = ")));
  return log[0].text;
}

void Flood::Handled(const std::string& message) {
  EXPECT_EQ(HANDLED, appliance.Handle(message)) << message.substr(0, 200);
}

void Flood::ExpectUnharmed(const std::string& flood) {
  Handled(GOOD);
  ExpectWithinBounds(flood);
}

void Flood::ExpectWithinBounds(const std::string& flood) {
  EXPECT_EQ(0, appliance.Service().Received()) << "the daemon has written to its peer";
  const long growth = memory_->Growth();
  if (!AreProgramsSanitized()) {
    EXPECT_GE(GROWTH_LIMIT, growth) << flood;
  }
  ReportFigure("KiB of memory that the daemon grew by at most under " + flood,
               std::to_string(growth));
}

} // namespace orva::test
