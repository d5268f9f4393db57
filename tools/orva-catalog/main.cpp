#include "CatalogSchema.h"
#include "Generator.h"
#include "Indexer.h"
#include "Options.h"

#include "commandline/Count.h"
#include "commandline/UsageError.h"

#include "orvadb/VolumeDB.h"

#include "orvautil/Core.h"
#include "orvautil/Exception.h"
#include "orvautil/Path.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <ctime>
#include <exception>
#include <filesystem>
#include <iostream>
#include <memory>
#include <regex>
#include <string>
#include <vector>

namespace {

using namespace orva;
using commandline::Count;

/// The volume's mount point with all links resolved. Throws when it is not a directory.
std::string FindVolume(const std::string& mountPoint) {
  std::string volume = util::Path(mountPoint).Canonicalize();
  if (volume.empty() || !std::filesystem::is_directory(volume)) {
    throw util::Exception(mountPoint + " is not a directory");
  }
  return volume;
}

/// Throws if this user may not write the volume's catalog.
void RequirePermission(const std::string& volume) {
  const std::string catalog = core::GetCatalogPath(volume);
  // SQLite makes further files in the catalog's folder, which is made in the volume.
  for (std::filesystem::path path = catalog;; path = path.parent_path()) {
    if (faccessat(AT_FDCWD, path.c_str(), W_OK, AT_EACCESS) == 0) {
      if (std::filesystem::is_directory(path)) {
        return;
      }
    } else if (errno == EACCES || errno == EROFS) {
      throw util::Exception("cannot write " + catalog + ": " + std::strerror(errno));
    } else if (errno != ENOENT || path == volume) {
      return;
    }
  }
}

std::unique_ptr<db::VolumeDB> OpenCatalog(const std::string& volume) {
  RequirePermission(volume);
  return catalog::OpenCatalog(volume);
}

/// A message of the database layer without the place in its source.
std::string WithoutPlace(const std::string& message) {
  static const std::regex place("^[^ ]*:[0-9]+: ");
  return std::regex_replace(message, place, "", std::regex_constants::format_first_only);
}

/// "1 folder, 2 files, 1 photo"
std::string Contents(const catalog::IndexSummary& summary) {
  return Count(summary.folders, "folder") + ", " + Count(summary.files, "file") + ", " +
         Count(summary.photos, "photo");
}

/// A line on the terminal that shows the progress of a run. It is erased at the end.
class ProgressLine {
public:
  ProgressLine() : isTerminal_(isatty(STDERR_FILENO) == 1) {}
  ProgressLine(const ProgressLine&) = delete;
  ProgressLine& operator=(const ProgressLine&) = delete;
  ~ProgressLine() {
    if (isTerminal_) {
      std::cerr << "\r\033[K" << std::flush;
    }
  }

  void Show(const catalog::IndexSummary& summary) {
    const auto now = std::chrono::steady_clock::now();
    if (!isTerminal_ || now - shown_ < std::chrono::milliseconds(100)) {
      return;
    }
    shown_ = now;
    std::cerr << "\r\033[K" << Contents(summary) << std::flush;
  }

private:
  const bool isTerminal_;
  std::chrono::steady_clock::time_point shown_;
};

void Index(const std::string& volume) {
  const auto database = OpenCatalog(volume);
  catalog::IndexSummary summary;
  {
    ProgressLine line;
    summary = catalog::Indexer(*database, volume, std::time(nullptr),
                               [&line](const catalog::IndexSummary& soFar) { line.Show(soFar); })
                  .Run();
  }
  catalog::Checkpoint(*database);
  for (const std::string& message : summary.unreadable) {
    std::cerr << "orva-catalog: not updated, cannot be read: " << message << '\n';
  }
  std::cout << volume << ": " << Contents(summary) << "; files: " << summary.added << " added, "
            << summary.changed << " changed, " << summary.deleted << " deleted, " << summary.revived
            << " revived\n";
}

void Generate(const std::string& volume, const catalog::GeneratorPlan& plan) {
  const auto database = OpenCatalog(volume);
  const long long folders = catalog::Generate(*database, plan, std::time(nullptr));
  catalog::Checkpoint(*database);
  std::cout << volume << ": generated " << Count(plan.files, "photo") << " in "
            << Count(folders, "folder") << '\n';
}

void Restamp(const std::string& volume) {
  if (!std::filesystem::exists(core::GetCatalogPath(volume))) {
    throw util::Exception(volume + " has no catalog");
  }
  const auto database = OpenCatalog(volume);
  const long long count = catalog::Restamp(*database, std::time(nullptr));
  catalog::Checkpoint(*database);
  std::cout << volume << ": stamped " << Count(count, "transcoding") << " again\n";
}

void Run(const catalog::Options& options) {
  switch (options.command) {
  case catalog::Command::Index:
    Index(FindVolume(options.mountPoint));
    break;
  case catalog::Command::Generate:
    Generate(FindVolume(options.mountPoint), options.plan);
    break;
  case catalog::Command::Restamp:
    Restamp(FindVolume(options.mountPoint));
    break;
  }
}

} // namespace

int main(int argc, char** argv) {
  try {
    if (const auto options = catalog::ParseOptions({argv + 1, argv + argc})) {
      Run(*options);
    }
    return 0;
  } catch (const commandline::UsageError& error) {
    commandline::Report(error);
    return commandline::EXIT_USAGE;
  } catch (const std::exception& error) {
    std::cerr << "orva-catalog: " << error.what() << '\n';
  } catch (const std::string& error) { // the database layer's
    std::cerr << "orva-catalog: " << WithoutPlace(error) << '\n';
  }
  return 1;
}
