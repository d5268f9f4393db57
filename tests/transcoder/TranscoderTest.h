#pragma once

#include "support/Program.h"
#include "system/Syslog.h"
#include "system/Volume.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// A transcoder, a notification service, and a volume whose catalog the test fills as the indexer
/// does.
class TranscoderTest : public testing::Test {
protected:
  using Lines = std::vector<std::string>;

  void SetUp() override;
  void TearDown() override;

  void StartService();
  /// `launcher`: a program with its options that runs it.
  void StartTranscoder(const Lines& launcher = {});
  /// Gives the transcoder a working folder in a file system of its own: "100m".
  void RestartInFileSystem(const std::string& size);
  /// Kills the transcoder.
  void KillTranscoder() { transcoder_.reset(); }
  Program& Transcoder() { return *transcoder_; }
  Program& Service() { return *service_; }

  /// Has the service announce an event of the volume: "scanned".
  void Announce(const std::string& event) const { Announce(event, Root()); }
  static void Announce(const std::string& event, const std::string& mountPoint);
  static void AnnounceDirectory(const std::string& mountPoint);

  /// The volume's mount point, and a path below it.
  std::string Root() const { return root_; }
  std::string At(const std::string& path) const { return root_ + '/' + path; }
  /// Uses another folder as the volume from now on.
  void UseRoot(const std::string& root) { root_ = root; }

  /// Copies /tmp/photo.jpg to the volume; unless the test has made it, a photo of 600 x 400 pixels.
  void CopyPhoto(const std::string& name) const;

  /// Enters the file into the catalog as a photo that waits, or as one that has changed. Returns
  /// its id.
  long long AddWaiting(const std::string& path) const;
  /// The same for the files.
  std::vector<long long> AddAllWaiting(const Lines& paths) const;
  /// Marks the photo as vanished.
  void AddRemoved(const std::string& path) const;

  /// The result of a query on the catalog: a line for each row, columns separated by "|".
  Lines Query(const std::string& sql, int columns = 1) const;
  long long Number(const std::string& sql) const;
  /// "finished", "failed: reason" or "waiting".
  std::string StateOf(const std::string& path) const;
  long long IdOf(const std::string& path) const;
  long long Waiting() const;

  /// The path of the photo's rendition.
  std::string Rendition(const std::string& path) const;
  std::string RenditionOf(long long id) const;

  /// Announces that the volume was scanned, and waits until no photo waits.
  void RenderAll() const;

  /// Waits until the condition holds; false after the deadline. Looks again after `pause`
  /// milliseconds, and leaves the processors to the programs meanwhile.
  static bool Await(const std::function<bool()>& condition, int pause = 5);
  /// Waits until the service has sent this message after the ones that were read before.
  bool AwaitSent(const std::string& text);

  /// The lines of the transcoder in the system log.
  Lines Logged() const;
  /// Waits until this is one of them.
  bool AwaitLogged(const std::string& line) const;

  /// What is in status.json.
  static std::string Status();
  static constexpr const char* RUNTIME = "/run/orva-transcoder";

private:
  std::unique_ptr<Syslog> log_;
  std::unique_ptr<Volume> volume_;
  std::string root_;
  std::unique_ptr<Program> service_;
  std::unique_ptr<Program> transcoder_;

protected:
  Volume& TheVolume() { return *volume_; }
};

} // namespace orva::test
