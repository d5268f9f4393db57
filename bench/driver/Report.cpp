#include "Report.h"

#include <sys/utsname.h>
#include <unistd.h>

#include <algorithm>
#include <ctime>
#include <fstream>
#include <iomanip>
#include <ostream>
#include <sstream>

namespace orva::bench {

namespace {

constexpr long long LARGE = 100'000;
constexpr long long LARGEST = 1'000'000;
constexpr double BYTES_A_FILE = 200;
constexpr double MEBIBYTE = 1024.0 * 1024.0;
constexpr double FIXED_BYTES = 80 * MEBIBYTE;

using Bound = Figure::Bound;

/// Median of the ratios of the pairs.
std::optional<double> Ratio(const Times& over, const Times& under) {
  Times ratios;
  for (std::size_t i = 0; i < std::min(over.size(), under.size()); ++i) {
    ratios.push_back(over[i] / under[i]);
  }
  return ratios.empty() ? std::nullopt : std::optional(Median(ratios));
}

std::optional<double> MedianOf(const Times& times) {
  return times.empty() ? std::nullopt : std::optional(Median(times));
}

const Measurement* Find(const Results& results, const std::string& what, const std::string& shape,
                        long long files) {
  const auto found = std::ranges::find_if(results.measurements, [&](const Measurement& measured) {
    return measured.what == what && measured.shape == shape && measured.files == files;
  });
  return found == results.measurements.end() ? nullptr : &*found;
}

/// `figure`, with the bound if it `applies`.
Figure Bounded(Figure figure, bool applies, Bound bound, double target) {
  if (applies) {
    figure.bound = bound;
    figure.target = target;
  }
  return figure;
}

/// What the daemon is compared with, and the target of the ratio.
struct Comparison {
  std::string what; ///< of the measurement
  std::string name; ///< of the ratio
  Times Measurement::*over;
  Times Measurement::*under;
  Bound bound = Bound::None;
  double target = 0;
};

const std::vector<Comparison> COMPARISONS{
    {FIRST_MERGE, "horizon / daemon", &Measurement::horizon, &Measurement::daemon, Bound::AtLeast,
     1.0},
    {FIRST_MERGE, "floor / daemon", &Measurement::floor, &Measurement::daemon},
    {FIRST_MERGE, "horizon / floor", &Measurement::horizon, &Measurement::floor},
    {FIRST_MERGE_FILE, "horizon / daemon", &Measurement::horizon, &Measurement::daemon,
     Bound::AtLeast, 0.75},
    {FIRST_MERGE_PIPE, "horizon / daemon", &Measurement::horizon, &Measurement::daemon,
     Bound::AtLeast, 0.75},
    {MERGED_AGAIN, "horizon / daemon", &Measurement::horizon, &Measurement::daemon, Bound::AtLeast,
     0.8},
    {MERGED_AGAIN, "floor / daemon", &Measurement::floor, &Measurement::daemon},
    {ONE_MORE_FILE, "horizon / daemon", &Measurement::horizon, &Measurement::daemon, Bound::AtLeast,
     0.5},
    {UNCHANGED_MERGE, "daemon / reader's statements", &Measurement::daemon, &Measurement::shell,
     Bound::AtMost, 1.2},
    {BATCH_OF_100, "daemon / reader's statements", &Measurement::daemon, &Measurement::shell,
     Bound::AtMost, 1.2},
    {BATCH_OF_KNOWN_NAMES, "daemon / reader's statements", &Measurement::daemon,
     &Measurement::shell, Bound::AtMost, 1.5},
    {SINGLE_ADDITIONS, "daemon / reader's statements", &Measurement::daemon, &Measurement::shell,
     Bound::AtMost, 1.5},
    {DELETE_ALL, "shell's DELETE / daemon", &Measurement::shell, &Measurement::daemon,
     Bound::AtLeast, 0.7},
};

/// Whether the targets apply to a catalog. They apply to the largest catalog of a shape.
bool IsLargest(const Measurement& measured) {
  if (measured.shape == "folders" || measured.shape == "covers") {
    return measured.files == LARGE;
  }
  return measured.shape == "same-names" || measured.files == LARGEST;
}

/// Adds the figures of a single measurement.
void AddFigures(std::vector<Figure>& figures, const Measurement& measured) {
  const auto figure = [&measured](const std::string& what, std::optional<double> value,
                                  std::size_t pairs) {
    return Figure{.what = measured.what + what,
                  .shape = measured.shape,
                  .files = measured.files,
                  .value = measured.gaveUp ? std::nullopt : value,
                  .pairs = pairs};
  };
  for (const Comparison& comparison : COMPARISONS) {
    if (comparison.what == measured.what) {
      const Times& over = measured.*comparison.over;
      const Times& under = measured.*comparison.under;
      figures.push_back(Bounded(
          figure(": " + comparison.name, Ratio(over, under), std::min(over.size(), under.size())),
          IsLargest(measured), comparison.bound, comparison.target));
    }
  }
  if (measured.what == PEAK_MEMORY) {
    const auto files = static_cast<double>(measured.files);
    const auto peak = MedianOf(measured.daemon);
    figures.push_back(
        Bounded(figure(" over idle, MiB", peak ? std::optional(*peak / MEBIBYTE) : std::nullopt,
                       measured.daemon.size()),
                true, Bound::AtMost, (BYTES_A_FILE * files + FIXED_BYTES) / MEBIBYTE));
    figures.push_back(figure(" over idle, bytes a file",
                             peak ? std::optional(*peak / files) : std::nullopt,
                             measured.daemon.size()));
  }
}

/// The most that the time of a measurement may grow with ten times the files.
struct Growth {
  std::string what; ///< of the measurement
  double target = 0;
};

const std::vector<Growth> GROWTHS{
    {FIRST_MERGE, 14}, {MERGED_AGAIN, 14}, {ONE_MORE_FILE, 13}, {DELETE_ALL, 12}};

/// Adds how many times longer the daemon takes for ten times the files.
void AddGrowth(std::vector<Figure>& figures, const Results& results, const Measurement& large) {
  const Measurement* const small = Find(results, large.what, large.shape, large.files / 10);
  const auto growth = std::ranges::find(GROWTHS, large.what, &Growth::what);
  if (small == nullptr || growth == GROWTHS.end()) {
    return;
  }
  const auto over = MedianOf(large.daemon);
  const auto under = MedianOf(small->daemon);
  Figure figure{.what = large.what + ": growth from a tenth",
                .shape = large.shape,
                .files = large.files,
                .pairs = std::min(large.daemon.size(), small->daemon.size())};
  if (over && under && !large.gaveUp && !small->gaveUp) {
    figure.value = *over / *under;
  }
  figures.push_back(Bounded(figure, IsLargest(large), Bound::AtMost, growth->target));
}

void AddMicro(std::vector<Figure>& figures, const MicroResult& micro) {
  const bool intake = micro.what.starts_with("notification");
  figures.push_back(
      Bounded(Figure{.what = micro.what + ": ours / theirs", .value = micro.ours / micro.theirs},
              intake, Bound::AtMost, 1.5));
}

std::string Number(double value) {
  std::ostringstream text;
  text << std::fixed << std::setprecision(value >= 100 ? 0 : value >= 10 ? 1 : 2) << value;
  return text.str();
}

std::string Seconds(const Times& times) {
  std::ostringstream text;
  if (!times.empty()) {
    text << std::fixed << std::setprecision(4) << Median(times);
  }
  return text.str();
}

std::string TargetText(const Figure& figure) {
  switch (figure.bound) {
  case Bound::AtLeast:
    return "at least " + Number(figure.target);
  case Bound::AtMost:
    return "at most " + Number(figure.target);
  case Bound::None:
    break;
  }
  return "";
}

std::string Verdict(const Figure& figure) {
  if (figure.bound == Bound::None) {
    return "";
  }
  return figure.IsReached() ? "ok" : "MISSED";
}

std::string CountText(long long count) {
  return count == 0 ? "" : std::to_string(count);
}

/// The model of the machine's processor.
std::string Processor() {
  std::ifstream file("/proc/cpuinfo");
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with("model name")) {
      return line.substr(line.find(": ") + 2);
    }
  }
  return "unknown";
}

std::string Machine() {
  utsname system{};
  uname(&system);
  std::ostringstream text;
  text << sysconf(_SC_NPROCESSORS_ONLN) << " x " << Processor() << ", "
       << (sysconf(_SC_PHYS_PAGES) * sysconf(_SC_PAGESIZE) >> 30) << " GiB, Linux "
       << static_cast<const char*>(system.release);
  return text.str();
}

std::string Today() {
  const std::time_t now = std::time(nullptr);
  std::tm parts{};
  gmtime_r(&now, &parts);
  std::ostringstream text;
  text << std::put_time(&parts, "%Y-%m-%d %H:%M UTC");
  return text.str();
}

std::string JsonText(const std::string& text) {
  std::string quoted = "\"";
  for (const char byte : text) {
    if (byte == '"' || byte == '\\') {
      quoted += '\\';
    }
    quoted += byte;
  }
  return quoted + '"';
}

std::string List(const Times& values) {
  std::ostringstream text;
  text << '[';
  for (std::size_t i = 0; i < values.size(); ++i) {
    text << (i == 0 ? "" : ", ") << values[i];
  }
  text << ']';
  return text.str();
}

std::string Json(const Figure& figure) {
  std::ostringstream text;
  text << "{\"what\": " << JsonText(figure.what) << ", \"shape\": " << JsonText(figure.shape)
       << ", \"files\": " << figure.files << ", \"pairs\": " << figure.pairs << ", \"value\": ";
  if (figure.value) {
    text << *figure.value;
  } else {
    text << "null";
  }
  text << ", \"target\": " << JsonText(TargetText(figure))
       << ", \"verdict\": " << JsonText(Verdict(figure)) << '}';
  return text.str();
}

std::string Json(const Measurement& measured) {
  std::ostringstream text;
  text << "{\"what\": " << JsonText(measured.what) << ", \"shape\": " << JsonText(measured.shape)
       << ", \"files\": " << measured.files << ", \"daemon\": " << List(measured.daemon)
       << ", \"horizon\": " << List(measured.horizon) << ", \"shell\": " << List(measured.shell)
       << ", \"floor\": " << List(measured.floor)
       << ", \"gaveUp\": " << (measured.gaveUp ? "true" : "false") << '}';
  return text.str();
}

std::string Json(const MicroResult& micro) {
  std::ostringstream text;
  text << "{\"what\": " << JsonText(micro.what) << ", \"ours\": " << micro.ours
       << ", \"theirs\": " << micro.theirs << '}';
  return text.str();
}

template <typename Item>
void WriteList(std::ostream& out, const std::string& name, const std::vector<Item>& items) {
  out << ",\n  " << JsonText(name) << ": [";
  for (std::size_t i = 0; i < items.size(); ++i) {
    out << (i == 0 ? "\n    " : ",\n    ") << Json(items[i]);
  }
  out << "\n  ]";
}

/// A row of the table: text is aligned left, numbers are aligned right.
template <typename... Cells>
void WriteRow(std::ostream& out, int width, const std::string& what, const std::string& shape,
              const std::string& files, const Cells&... cells) {
  std::ostringstream line;
  line << std::left << std::setw(width) << what << std::setw(11) << shape << std::right
       << std::setw(8) << files;
  ((line << "  " << std::setw(13) << cells), ...);
  std::string text = line.str();
  text.erase(text.find_last_not_of(' ') + 1);
  out << text << '\n';
}

} // namespace

bool Figure::IsReached() const {
  return value && (bound == Bound::AtLeast ? *value >= target : *value <= target);
}

std::vector<Figure> ComputeFigures(const Results& results) {
  std::vector<Figure> figures;
  for (const Measurement& measurement : results.measurements) {
    AddFigures(figures, measurement);
    AddGrowth(figures, results, measurement);
  }
  for (const MicroResult& micro : results.micro) {
    AddMicro(figures, micro);
  }
  std::ranges::stable_sort(figures, {}, [](const Figure& figure) {
    return std::pair(figure.bound == Bound::None, figure.what);
  });
  return figures;
}

void WriteTable(std::ostream& out, const std::vector<Figure>& figures, const Results& results) {
  constexpr int FIGURE_WIDTH = 54;
  constexpr int TIME_WIDTH = 33;
  out << Today() << ", " << Machine() << "\n\n";
  WriteRow(out, FIGURE_WIDTH, "FIGURE", "SHAPE", "FILES", "MEASURED", "TARGET", "", "PAIRS");
  for (const Figure& figure : figures) {
    WriteRow(out, FIGURE_WIDTH, figure.what, figure.shape, CountText(figure.files),
             figure.value ? Number(*figure.value) : "gave up", TargetText(figure), Verdict(figure),
             CountText(static_cast<long long>(figure.pairs)));
  }
  out << "\nMedians in seconds. The time to start a process is subtracted from horizon, shell and\n"
         "floor. SHELL has the reader's statements, or the DELETE for a deletion. The floor runs\n"
         "in the first two pairs. A measurement makes no further pairs after two minutes.\n\n";
  WriteRow(out, TIME_WIDTH, "WHAT", "SHAPE", "FILES", "DAEMON", "HORIZON", "SHELL", "FLOOR",
           "PAIRS");
  for (const Measurement& measured : results.measurements) {
    if (measured.what != PEAK_MEMORY) {
      WriteRow(out, TIME_WIDTH, measured.what, measured.shape, CountText(measured.files),
               measured.gaveUp ? "gave up" : Seconds(measured.daemon), Seconds(measured.horizon),
               Seconds(measured.shell), Seconds(measured.floor),
               CountText(static_cast<long long>(measured.daemon.size())));
    }
  }
}

void WriteJson(std::ostream& out, const std::vector<Figure>& figures, const Results& results) {
  out << "{\n  \"date\": " << JsonText(Today()) << ",\n  \"machine\": " << JsonText(Machine());
  WriteList(out, "figures", figures);
  WriteList(out, "measurements", results.measurements);
  WriteList(out, "micro", results.micro);
  out << "\n}\n";
}

void WritePlotData(std::ostream& out, const Results& results) {
  std::string shape;
  for (const Measurement& measured : results.measurements) {
    if ((measured.what != FIRST_MERGE && measured.what != MERGED_AGAIN) || measured.floor.empty()) {
      continue;
    }
    if (measured.shape != shape) {
      shape = measured.shape;
      out << "\n\n# " << shape << '\n';
    }
    out << measured.files << ' ' << Seconds(measured.daemon) << ' ' << Seconds(measured.horizon)
        << ' ' << Seconds(measured.floor) << '\n';
  }
}

} // namespace orva::bench
