#include "MeasuredDaemon.h"

#include "Messages.h"

#include <fstream>
#include <limits>
#include <stdexcept>

namespace orva::bench {

namespace {

const std::string NULL_DEVICE = "/dev/null";
const std::string FILE_OUTPUT = "/tmp/daemon.out";
const std::string PIPE_OUTPUT = "/tmp/daemon.pipe";

std::string ProcessFile(pid_t pid, const std::string& name) {
  return "/proc/" + std::to_string(pid) + "/" + name;
}

} // namespace

MeasuredDaemon::MeasuredDaemon(const test::Volume& master, const test::Volume& library,
                               Output output)
    : batch_(test::TranscodedBatch(library.Path())) {
  switch (output) {
  case Output::Null:
    appliance_.StartWithOutput(NULL_DEVICE);
    break;
  case Output::File:
    appliance_.StartWithOutput(FILE_OUTPUT);
    break;
  case Output::Pipe:
    pipe_.emplace(PIPE_OUTPUT);
    appliance_.StartWithOutput(PIPE_OUTPUT);
    break;
  }
  for (const test::Volume* volume : {&master, &library}) {
    appliance_.Handle(test::Plugged(volume->Path()));
  }
  appliance_.Handle(test::Scanned(master.Path()));
  // Resets the peak to the memory that the process has now.
  std::ofstream(ProcessFile(appliance_.Daemon().Pid(), "clear_refs")) << 5;
  idle_ = PeakMemory();
}

MeasuredDaemon::~MeasuredDaemon() {
  if (answers_) {
    appliance_.Shutdown();
  }
}

std::optional<double> MeasuredDaemon::Merge(std::chrono::seconds limit) {
  const std::string name = "merged" + std::to_string(++merges_);
  const std::string barrier = "<" + name + " about=\"ORVANotification\"/>";
  const test::LogLine handled = test::Error("ERROR ! Node name = " + name);

  const auto begin = std::chrono::steady_clock::now();
  const auto elapsed = [&begin] {
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - begin);
  };
  appliance_.Service().Send(batch_);
  appliance_.Service().Send(barrier);
  while (!appliance_.Log().Await(handled)) {
    if (elapsed() > limit) {
      answers_ = false;
      return std::nullopt;
    }
  }
  return elapsed().count();
}

double MeasuredDaemon::PeakOverIdle() const {
  return PeakMemory() - idle_;
}

double MeasuredDaemon::PeakMemory() const {
  std::ifstream status(ProcessFile(appliance_.Daemon().Pid(), "status"));
  for (std::string key; status >> key; status.ignore(std::numeric_limits<int>::max(), '\n')) {
    if (key == "VmHWM:") {
      double kibibytes = 0;
      status >> kibibytes;
      return kibibytes * 1024;
    }
  }
  throw std::runtime_error("the daemon's memory cannot be read");
}

} // namespace orva::bench
