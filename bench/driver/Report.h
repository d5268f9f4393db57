#pragma once

#include "Results.h"

#include <iosfwd>
#include <optional>
#include <string>
#include <vector>

namespace orva::bench {

/// One figure beside its target.
struct Figure {
  enum class Bound { None, AtLeast, AtMost };

  std::string what;
  std::string shape{};
  long long files = 0;           ///< 0 where there is no catalog
  std::optional<double> value{}; ///< nothing when a merge was given up
  Bound bound = Bound::None;     ///< None: reported only
  double target = 0;
  std::size_t pairs = 0;

  bool IsReached() const;
};

/// The figures that the measurements give, those with a target first.
std::vector<Figure> ComputeFigures(const Results& results);

/// The figures and the times behind them, for people.
void WriteTable(std::ostream& out, const std::vector<Figure>& figures, const Results& results);

/// The same for programs.
void WriteJson(std::ostream& out, const std::vector<Figure>& figures, const Results& results);

/// Time of a first merge against size for the picture: a block "# shape" for each shape, lines of
/// files and the medians of daemon, horizon and floor in seconds.
void WritePlotData(std::ostream& out, const Results& results);

} // namespace orva::bench
