#pragma once

#include "HttpClient.h"

#include "support/Program.h"
#include "system/Catalog.h"
#include "system/Expectations.h"
#include "system/Messages.h"

#include <nlohmann/json.hpp>

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace orva::test {

/// The real zophotos-web, with the real daemon, on a volume A with three photos and their
/// renditions: top.jpg, sea/one.jpg and sea/deep/two.jpg, from the oldest to the newest.
class WebTest : public SystemTest {
protected:
  using Json = nlohmann::ordered_json;

  void SetUp() override;
  void TearDown() override;

  /// Starts zophotos-web at any port. `prefix` is a command that starts it.
  void StartWeb(const Program::Arguments& options = {}, Program::Arguments prefix = {});

  /// Stops it as systemd does. Returns its exit status.
  int StopWeb();

  /// Adds a photo to a volume and its catalog, with a rendition.
  static void AddPhoto(Catalog& catalog, const std::string& volume, const std::string& path,
                       long modified, long stamp);

  /// Lets the daemon merge the changes of a volume.
  void Merge(const Volume& volume) { appliance.Handle(TranscodedBatch(volume.Path())); }

  HttpResponse Get(const std::string& target, const std::string& headers = "") const {
    return test::Get(port, target, headers);
  }

  /// The document at a path of the JSON interface, which must be there.
  Json GetJson(const std::string& target) const;

  /// Waits until the page shows so many photos in all. Returns whether it does before the deadline.
  bool AwaitPhotos(std::size_t count) const;

  /// The paths of a list of photos.
  Lines Paths(const std::string& query = "") const;

  /// The id of the photo at `path`; empty if there is none.
  std::string IdOf(const std::string& path) const;

  /// Waits until zophotos-web has nothing open below `path`, as after each response. Returns what
  /// it has open there after the deadline.
  Lines AwaitNothingOpenBelow(const std::string& path) const;

  /// Where a rendition is.
  static std::string RenditionOf(const Catalog& catalog, const std::string& volume,
                                 const std::string& path);

  static void Write(const std::string& path, const std::string& content);

  const Volume a{"A", "150g"};
  Catalog onA{a};
  std::unique_ptr<Program> web;
  std::uint16_t port = 0;

private:
  Lines OpenBelow(const std::string& path) const;
};

} // namespace orva::test
