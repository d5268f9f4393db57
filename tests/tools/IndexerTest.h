#pragma once

#include "support/Program.h"
#include "system/Syslog.h"
#include "system/Volume.h"

#include "orvautil/ClientSocket.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

using Lines = std::vector<std::string>;

/// The real indexer with the real notification service, in the test's private root. The
/// notification service watches mounts.
class IndexerTest : public testing::Test {
protected:
  IndexerTest();
  ~IndexerTest() override;

  /// Starts the notification service, and reads what it sends.
  void StartService();

  /// Starts the indexer. `prefix` is a command that starts it.
  void StartIndexer(Program::Arguments prefix = {});

  /// Starts the indexer in other surroundings, which SurroundingsProbe.cpp describes.
  void StartIndexerIn(const Program::Arguments& surroundings);

  /// Stops the indexer as systemd does, and expects that it ends well.
  void StopIndexer();

  Program& Indexer() { return *indexer_; }
  Program& Service() { return *service_; }

  /// Waits until `condition` holds. It is checked after each notification, and now and then. False
  /// after the deadline.
  bool Await(const std::function<bool()>& condition);

  /// Waits until the catalog describes what is on the volume, and lists the differences otherwise.
  Lines AwaitCatalog(const std::string& volume);

  /// Starts the notification service and the indexer first.
  Lines StartAndAwaitCatalog(const std::string& volume);

  /// Waits for a line of the indexer in the system log that contains `text`.
  bool AwaitLog(const std::string& text);

  /// The lines of the indexer in the system log that contain `text`.
  Lines LogLines(const std::string& text = "") const;

  /// The lines of the indexer with the level of errors.
  Lines ErrorLines() const;

  /// The names of all notifications about a volume so far, such as "Scanned".
  Lines Events(const std::string& volume);

  /// Sends a message that says that a plain directory is a volume.
  void PlugDirectory(const std::string& directory);

  /// Sends an event of orva-notify's command line.
  void Send(const std::string& event, const std::string& volume);

  /// The rows of the volume's catalog that a query finds; nothing while it cannot be read.
  static Lines Query(const std::string& volume, const std::string& sql);

  /// What the catalog says about the files and folders on the volume, and what a new catalog of it
  /// would say.
  static Lines Described(const std::string& volume);
  Lines Expected(const std::string& volume) const;

  /// The path of a volume's catalog.
  static std::string CatalogOf(const std::string& volume) { return volume + "/.orva/orva.db"; }

  /// Writes a file, and its folders.
  static void Write(const std::string& path, const std::string& content = "content");

  /// The state of a volume in the status file.
  static std::string State(const std::string& volume);

  static constexpr char STATE_DIRECTORY[] = "/tmp/state";
  static constexpr char RUNTIME_DIRECTORY[] = "/tmp/runtime";

private:
  void ReadNotifications(int milliseconds);

  Syslog log_;
  std::unique_ptr<Program> service_;
  std::unique_ptr<Program> indexer_;
  std::unique_ptr<util::ClientSocket> observer_;
  std::string input_; ///< of the observer, all of it
};

} // namespace orva::test
