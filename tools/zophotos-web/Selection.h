#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace orva::web {

/// The photos that a list shows, as the query of its address says. The default is all photos.
struct Selection {
  std::string words;                  ///< as typed
  std::optional<std::string> volume;  ///< mount point, with a separator at its end
  std::optional<std::int64_t> folder; ///< only the photos directly in it
  std::optional<int> year;
  std::optional<int> month; ///< 1 to 12; only together with a year

  bool operator==(const Selection&) const = default;
};

/// The value of the parameter "month": YYYY-MM, or YYYY for a whole year. Empty for all times.
std::string MonthText(const Selection& selection);

/// The address `path` with the selection as its query: "/search?words=sea&month=2026-11". Every
/// byte but ASCII letters, digits and "-._~" is percent-encoded.
std::string Address(const std::string& path, const Selection& selection);

/// `address` with one parameter more.
std::string WithParameter(const std::string& address, const std::string& name,
                          const std::string& value);

} // namespace orva::web
