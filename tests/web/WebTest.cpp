#include "WebTest.h"

#include "support/Programs.h"
#include "system/Deadline.h"

#include <poll.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>

namespace orva::test {

namespace fs = std::filesystem;

void WebTest::SetUp() {
  setenv("TZ", "UTC", 1);
  onA.Rows().Run("PRAGMA journal_mode = WAL");
  onA.AddFolder("sea/", 500);
  onA.AddFolder("sea/deep/", 600);
  AddPhoto(onA, a.Path(), "top.jpg", 1'000'000'000, 2000);
  AddPhoto(onA, a.Path(), "sea/one.jpg", 1'000'000'001, 2001);
  AddPhoto(onA, a.Path(), "sea/deep/two.jpg", 1'000'000'002, 2002);
  appliance.Start();
  appliance.Handle(Plugged(a.Path()));
  appliance.Handle(Scanned(a.Path()));
  Merge(a);
  StartWeb();
  ASSERT_TRUE(AwaitPhotos(3));
}

void WebTest::TearDown() {
  if (web != nullptr) {
    EXPECT_EQ(0, StopWeb());
  }
  SystemTest::TearDown();
}

void WebTest::StartWeb(const Program::Arguments& options, Program::Arguments prefix) {
  prefix.insert(prefix.end(),
                {ProgramPath("zophotos-web"), "--listen", "127.0.0.1:0", "--cache", "/tmp/cache"});
  prefix.insert(prefix.end(), options.begin(), options.end());
  web = std::make_unique<Program>(prefix);
  const std::string line = web->ReadLineWith("listening on http://127.0.0.1:");
  const std::size_t colon = line.find("127.0.0.1:");
  if (colon == std::string::npos) {
    throw std::runtime_error("zophotos-web does not listen: " + line);
  }
  port = static_cast<std::uint16_t>(std::stoul(line.substr(colon + 10)));
}

int WebTest::StopWeb() {
  web->Signal(SIGTERM);
  std::string output;
  std::string error;
  web->ReadToEnd(output, error);
  const int status = web->WaitForEnd();
  web.reset();
  return status;
}

void WebTest::AddPhoto(Catalog& catalog, const std::string& volume, const std::string& path,
                       long modified, long stamp) {
  catalog.AddPhoto(path, modified, stamp);
  Write(volume + '/' + path, "original of " + path);
  Write(RenditionOf(catalog, volume, path), "rendition of " + path);
}

WebTest::Json WebTest::GetJson(const std::string& target) const {
  const HttpResponse response = Get(target);
  EXPECT_EQ(200, response.status) << target << ": " << response.body;
  EXPECT_EQ("application/json", response.Header("content-type"));
  return Json::parse(response.body);
}

bool WebTest::AwaitPhotos(std::size_t count) const {
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  while (std::chrono::steady_clock::now() < end) {
    if (GetJson("/api/photos?count=200").at("photos").size() == count) {
      return true;
    }
    poll(nullptr, 0, 20);
  }
  return false;
}

Lines WebTest::Paths(const std::string& query) const {
  Lines paths;
  const Json list = GetJson("/api/photos" + query);
  for (const Json& photo : list.at("photos")) {
    paths.push_back(photo.at("path"));
  }
  return paths;
}

std::string WebTest::IdOf(const std::string& path) const {
  const Json list = GetJson("/api/photos?count=200");
  for (const Json& photo : list.at("photos")) {
    if (photo.at("path") == path) {
      return photo.at("id");
    }
  }
  return {};
}

Lines WebTest::AwaitNothingOpenBelow(const std::string& path) const {
  const auto end = std::chrono::steady_clock::now() + DEADLINE;
  Lines open = OpenBelow(path);
  while (!open.empty() && std::chrono::steady_clock::now() < end) {
    poll(nullptr, 0, 20);
    open = OpenBelow(path);
  }
  return open;
}

Lines WebTest::OpenBelow(const std::string& path) const {
  Lines open;
  for (const auto& entry : fs::directory_iterator("/proc/" + std::to_string(web->Pid()) + "/fd")) {
    std::error_code closed;
    const std::string file = fs::read_symlink(entry, closed);
    if (file.starts_with(path)) {
      open.push_back(file);
    }
  }
  return open;
}

std::string WebTest::RenditionOf(const Catalog& catalog, const std::string& volume,
                                 const std::string& path) {
  const std::string id = catalog.Rows().Run("SELECT id FROM Files WHERE path = ?", {path}).at(0);
  return volume + "/.orva/renditions/" + std::to_string(std::stoll(id) / 1000) + '/' + id + ".jpg";
}

void WebTest::Write(const std::string& path, const std::string& content) {
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
}

} // namespace orva::test
