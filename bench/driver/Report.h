#pragma once

#include "Results.h"

#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace orva::bench {

/// A figure and its target.
struct Figure {
  enum class Bound { None, AtLeast, AtMost };

  std::string what;
  std::string shape{};
  long long files = 0;           ///< 0 when there is no catalog
  std::optional<double> value{}; ///< nothing when a merge was given up
  Bound bound = Bound::None;     ///< None: has no target
  double target = 0;
  std::size_t pairs = 0;

  bool IsReached() const;
};

/// Computes the figures from the measurements. Those with a target come first.
std::vector<Figure> ComputeFigures(const Results& results);

/// Writes the figures and the times that they are computed from, for people.
void WriteTable(std::ostream& out, const std::vector<Figure>& figures, const Results& results);

/// Writes the same for programs.
void WriteJson(std::ostream& out, const std::vector<Figure>& figures, const Results& results);

/// Writes the data of the plot, time of a merge of all files against size. Each shape has a block
/// "# shape" of lines with the number of files and the medians of daemon, horizon and floor in
/// seconds.
void WritePlotData(std::ostream& out, const Results& results);

} // namespace orva::bench
