#pragma once

#include "ZophotosTest.h"

#include "orvautil/FileDescriptor.h"

#include <memory>
#include <string>

namespace orva::test {

/// A pseudo terminal of a given size.
class Terminal {
public:
  explicit Terminal(int columns, int rows = 24);

  /// Runs zophotos with both outputs on the terminal, and returns the lines.
  Lines Run(const Arguments& arguments) const;

  /// Starts zophotos with both outputs on the terminal.
  std::unique_ptr<Program> Start(const Arguments& arguments) const;

  /// Reads the output, without carriage returns, up to and with `end`; what there is if that does
  /// not come.
  std::string ReadTo(const std::string& end);

private:
  /// Reads what there is into `text`. False when none comes, or the program has closed the
  /// terminal.
  bool Read(std::string& text) const;

  util::FileDescriptor master_;
  std::string rest_; ///< read, but not returned yet
};

} // namespace orva::test
