#include "Commands.h"
#include "Json.h"
#include "MergedDatabase.h"

#include <SQLiteCpp/Exception.h>
#include <SQLiteCpp/Statement.h>

#include <span>
#include <vector>

namespace orva::zophotos {

namespace {

constexpr std::size_t MOST_EXAMPLES = 20;

/// A check: each row of `sql` is one problem, described by one text.
struct Check {
  const char* kind;  ///< for programs
  const char* title; ///< for people
  const char* sql;
};

/// The problems that a check found.
struct Finding {
  const Check* check;
  std::int64_t count = 0;
  std::vector<std::string> examples{}; ///< the first ones

  void Add(const std::string& example) {
    ++count;
    if (examples.size() < MOST_EXAMPLES) {
      examples.push_back(example);
    }
  }
};

constexpr Check INTEGRITY = {
    "integrity", "errors in the file",
    "SELECT integrity_check FROM pragma_integrity_check(1000) WHERE integrity_check != 'ok'"};

constexpr Check DAMAGE[] = {
    {"no_status", "status row missing",
     "SELECT 'Status' WHERE NOT EXISTS (SELECT 1 FROM Status WHERE id = 1)"},
    {"no_root", "root folder missing",
     "SELECT 'Folders' WHERE NOT EXISTS (SELECT 1 FROM Folders WHERE folder_id = 1 AND name = "
     "'/shares/')"},
    {"file_without_folder", "files without a folder",
     "SELECT 'file ' || f.file_id || ', ' || f.name || ', of ' || f.volume || ': no folder ' || "
     "f.folder_id FROM Files f WHERE NOT EXISTS (SELECT 1 FROM Folders o WHERE o.folder_id = "
     "f.folder_id)"},
    {"file_of_other_volume", "files with another volume than their folder",
     "SELECT o.name || f.name || ', of ' || f.volume || ' in a folder of ' || o.volume FROM Files f "
     "JOIN Folders o ON o.folder_id = f.folder_id WHERE f.volume != o.volume"},
    {"duplicate_folder", "duplicate folders",
     "SELECT name || ', ' || count(*) || ' times' FROM Folders GROUP BY name HAVING count(*) > 1"},
    {"duplicate_file", "duplicate files",
     "SELECT o.name || f.name || ', ' || count(*) || ' times' FROM Files f JOIN Folders o ON "
     "o.folder_id = f.folder_id GROUP BY f.folder_id, f.name, f.volume HAVING count(*) > 1"},
    {"duplicate_statistics", "volumes with more than one row of statistics",
     "SELECT volume || ', ' || count(*) || ' times' FROM Statistics GROUP BY volume HAVING count(*) "
     "> 1"},
};

/// What the daemon leaves in the database by its rules. doc/database.md describes it.
constexpr Check LEFTOVERS[] = {
    {"statistics_without_content", "statistics of volumes without merged content",
     "SELECT volume FROM Statistics s WHERE NOT EXISTS (SELECT 1 FROM Folders o WHERE o.volume = "
     "s.volume) ORDER BY volume"},
    {"folder_without_parent", "folders whose parent folder was removed",
     "SELECT name FROM Folders o WHERE parent_folder_id != -1 AND NOT EXISTS (SELECT 1 FROM Folders "
     "p WHERE p.folder_id = o.parent_folder_id) ORDER BY name"},
};

struct Report {
  std::vector<Finding> damage;
  std::vector<Finding> leftovers;
};

/// Runs the check of `finding` and adds what it finds. An error in the file goes to `faults`.
void Run(SQLite::Database& database, Finding& finding, Finding& faults) {
  try {
    SQLite::Statement query(database, finding.check->sql);
    while (query.executeStep()) {
      finding.Add(query.getColumn(0).getString());
    }
  } catch (const SQLite::Exception& error) {
    if (!IsDamage(error)) {
      throw;
    }
    faults.Add(std::string(error.what()) + ", while looking for " + finding.check->title);
  }
}

std::vector<Finding> RunAll(SQLite::Database& database, std::span<const Check> checks,
                            Finding& faults) {
  std::vector<Finding> findings;
  for (const Check& check : checks) {
    Finding finding{.check = &check};
    Run(database, finding, faults);
    if (finding.count > 0) {
      findings.push_back(std::move(finding));
    }
  }
  return findings;
}

Report Examine(const std::string& path) {
  Report report;
  Finding faults{.check = &INTEGRITY};
  try {
    SQLite::Database database = CopyDatabase(path);
    Run(database, faults, faults);
    report.damage = RunAll(database, DAMAGE, faults);
    report.leftovers = RunAll(database, LEFTOVERS, faults);
  } catch (const SQLite::Exception& error) {
    if (!IsDamage(error)) {
      throw;
    }
    faults.Add(error.what());
  }
  if (faults.count > 0) {
    report.damage.insert(report.damage.begin(), std::move(faults));
  }
  return report;
}

void PrintFindings(const std::string& heading, const std::vector<Finding>& findings) {
  if (findings.empty()) {
    return;
  }
  std::cout << heading << '\n';
  for (const Finding& finding : findings) {
    std::cout << "  " << finding.check->title << ": " << finding.count << '\n';
    for (const std::string& example : finding.examples) {
      std::cout << "    " << Printable(example) << '\n';
    }
    const auto listed = static_cast<std::int64_t>(finding.examples.size());
    if (listed < finding.count) {
      std::cout << "    and " << finding.count - listed << " more\n";
    }
  }
}

Json ToJson(const std::vector<Finding>& findings) {
  Json list = Json::array();
  for (const Finding& finding : findings) {
    Json examples = Json::array();
    for (const std::string& example : finding.examples) {
      examples.push_back(ToUtf8(example));
    }
    list.push_back({{"kind", finding.check->kind},
                    {"count", finding.count},
                    {"examples", std::move(examples)}});
  }
  return list;
}

} // namespace

ExitStatus CheckDatabase(const std::string& path, Form form) {
  const Report report = Examine(path);
  const bool isSound = report.damage.empty();
  if (form == Form::JsonText) {
    PrintLine({{"database", ToUtf8(path)},
               {"sound", isSound},
               {"damage", ToJson(report.damage)},
               {"leftovers", ToJson(report.leftovers)}});
  } else {
    std::cout << Printable(path) << (isSound ? " is sound\n" : " is damaged\n");
    PrintFindings("Damage:", report.damage);
    PrintFindings("Expected leftovers (not damage):", report.leftovers);
  }
  return isSound ? ExitStatus::Success : ExitStatus::Negative;
}

} // namespace orva::zophotos
