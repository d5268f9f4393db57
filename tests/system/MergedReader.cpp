// Reads a merged database as other programs of the appliance do, in one transaction after the
// other, until its standard input ends. Writes a line to standard output for each transaction: the
// microseconds until it had its lock, then its numbers for one volume: files, files without a
// folder, folders, and those of the statistics row.
//
//   merged_reader LOCATION VOLUME

#include "Database.h"

#include <poll.h>
#include <unistd.h>

#include <chrono>
#include <iostream>

namespace {

bool IsInputOpen() {
  pollfd input{STDIN_FILENO, POLLIN, 0};
  return poll(&input, 1, 0) == 0;
}

} // namespace

int main(int argc, char* argv[]) {
  if (argc != 3) {
    return 2;
  }
  const orva::test::Database database(std::string(argv[1]) + "/.zophotos/zophotos.db");
  const orva::test::Database::Values volume{argv[2]};
  while (IsInputOpen()) {
    using std::chrono::steady_clock;
    const auto begin = steady_clock::now();
    database.Run("BEGIN");
    database.Run("SELECT mdate FROM Status");
    const auto wait =
        std::chrono::duration_cast<std::chrono::microseconds>(steady_clock::now() - begin);
    const auto seen = database.Run(
        "SELECT (SELECT count(*) FROM Files WHERE volume = ?1), "
        "(SELECT count(*) FROM Files WHERE folder_id NOT IN (SELECT folder_id FROM Folders)), "
        "(SELECT count(*) FROM Folders WHERE volume = ?1), photos_xcoded, photos_total, "
        "last_updated_time FROM Statistics WHERE volume = ?1",
        volume);
    database.Run("COMMIT");
    std::cout << wait.count() << '|' << seen.at(0) << std::endl;
  }
  return 0;
}
