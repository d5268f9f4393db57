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
constexpr double BYTES_A_FILE = 400;
constexpr double MEBIBYTE = 1024.0 * 1024.0;
constexpr double FIXED_BYTES = 96 * MEBIBYTE;

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

/// Adds the figures of a single measurement.
void AddFigures(std::vector<Figure>& figures, const Measurement& measured) {
  const auto figure = [&measured](std::string what, std::optional<double> value) {
    return Figure{.what = std::move(what),
                  .shape = measured.shape,
                  .files = measured.files,
                  .value = measured.gaveUp ? std::nullopt : value,
                  .pairs = measured.daemon.size()};
  };
  if (measured.what == FIRST_MERGE) {
    figures.push_back(
        Bounded(figure("first merge: floor / daemon", Ratio(measured.floor, measured.daemon)),
                measured.files >= LARGE, Bound::AtLeast, 0.9));
    figures.push_back(
        figure("first merge: horizon / daemon", Ratio(measured.horizon, measured.daemon)));
    figures.push_back(
        figure("first merge: horizon / floor", Ratio(measured.horizon, measured.floor)));
  } else if (measured.what == UNCHANGED_MERGE) {
    figures.push_back(Bounded(figure("unchanged merge: daemon / reader's statements",
                                     Ratio(measured.daemon, measured.floor)),
                              measured.shape == "folders", Bound::AtMost, 3));
  } else if (measured.what == BATCH_OF_100) {
    figures.push_back(Bounded(figure("batch of 100: daemon / reader's statements",
                                     Ratio(measured.daemon, measured.floor)),
                              measured.files >= LARGEST, Bound::AtMost, 1.5));
  } else if (measured.what == PEAK_MEMORY) {
    const auto files = static_cast<double>(measured.files);
    const auto peak = MedianOf(measured.daemon);
    figures.push_back(Bounded(
        figure("peak memory over idle, MiB", peak ? std::optional(*peak / MEBIBYTE) : std::nullopt),
        true, Bound::AtMost, (BYTES_A_FILE * files + FIXED_BYTES) / MEBIBYTE));
    figures.push_back(figure("peak memory over idle, bytes a file",
                             peak ? std::optional(*peak / files) : std::nullopt));
  }
}

/// Adds how many times longer the daemon takes for ten times the files.
void AddGrowth(std::vector<Figure>& figures, const Results& results, const Measurement& large) {
  const Measurement* const small = Find(results, large.what, large.shape, large.files / 10);
  if (small == nullptr || (large.what != FIRST_MERGE && large.what != DELETE_ALL)) {
    return;
  }
  const auto over = MedianOf(large.daemon);
  const auto under = MedianOf(small->daemon);
  Figure growth{.what = large.what + ": growth from a tenth",
                .shape = large.shape,
                .files = large.files,
                .pairs = std::min(large.daemon.size(), small->daemon.size())};
  if (over && under && !large.gaveUp && !small->gaveUp) {
    growth.value = *over / *under;
  }
  if (large.what == FIRST_MERGE) {
    figures.push_back(Bounded(growth, large.files == LARGEST, Bound::AtMost, 14));
  } else {
    figures.push_back(
        Bounded(growth, large.shape == "flat" && large.files == LARGE, Bound::AtMost, 15));
  }
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
       << ", \"floor\": " << List(measured.floor) << ", \"horizon\": " << List(measured.horizon)
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
  constexpr int FIGURE_WIDTH = 49;
  constexpr int TIME_WIDTH = 25;
  out << Today() << ", " << Machine() << "\n\n";
  WriteRow(out, FIGURE_WIDTH, "FIGURE", "SHAPE", "FILES", "MEASURED", "TARGET", "", "PAIRS");
  for (const Figure& figure : figures) {
    WriteRow(out, FIGURE_WIDTH, figure.what, figure.shape, CountText(figure.files),
             figure.value ? Number(*figure.value) : "gave up", TargetText(figure), Verdict(figure),
             CountText(static_cast<long long>(figure.pairs)));
  }
  out << "\nMedians in seconds. The time to start a process is subtracted from floor, horizon and\n"
         "shell. For an unchanged merge and a batch, FLOOR is the shell with the reader's\n"
         "statements. A measurement makes no further pairs after two minutes. The deletion of\n"
         "more than 100000 files is measured once.\n\n";
  WriteRow(out, TIME_WIDTH, "WHAT", "SHAPE", "FILES", "DAEMON", "FLOOR", "HORIZON", "PAIRS");
  for (const Measurement& measured : results.measurements) {
    if (measured.what != PEAK_MEMORY) {
      WriteRow(out, TIME_WIDTH, measured.what, measured.shape, CountText(measured.files),
               measured.gaveUp ? "gave up" : Seconds(measured.daemon), Seconds(measured.floor),
               Seconds(measured.horizon),
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
    if (measured.what != FIRST_MERGE || measured.floor.empty()) {
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
