#include "DaemonProcess.h"

#include "support/Programs.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <utility>

namespace orva::test {

namespace {

Program::Arguments Command() {
  Program::Arguments command{ProgramPath("zophotodbmerger")};
  if (const char* launcher = std::getenv("ORVA_TEST_LAUNCHER")) {
    command.insert(command.begin(), launcher);
  }
  return command;
}

std::string Created(std::string directory) {
  std::filesystem::create_directory(directory);
  return directory;
}

} // namespace

DaemonProcess::DaemonProcess(std::string directory, std::string output,
                             const std::vector<std::string>& environment, bool held)
    : directory_(Created(std::move(directory))), output_(std::move(output)),
      program_(Command(), {.output = output_,
                           .errors = Program::Errors::Inherited,
                           .directory = directory_,
                           .environment = environment,
                           .held = held}) {}

DaemonProcess::~DaemonProcess() {
  if (IsRunning()) {
    ADD_FAILURE() << "the daemon still runs";
  }
}

std::vector<std::string> DaemonProcess::StandardOutput() const {
  std::ifstream file(output_);
  std::vector<std::string> lines;
  for (std::string line; std::getline(file, line);) {
    lines.push_back(line);
  }
  return lines;
}

} // namespace orva::test
