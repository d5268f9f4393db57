// zophotos-web with hostile volumes, databases and clients.

#include "WebTest.h"

#include "hostile/SpecialFile.h"
#include "support/OtherUsers.h"
#include "support/Programs.h"
#include "system/PeakMemory.h"

#include <poll.h>
#include <sys/mount.h>
#include <sys/socket.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <list>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::Not;

class WebHostile : public WebTest {
protected:
  std::string Target(const std::string& path, const std::string& file) const {
    return "/photos/" + IdOf(path) + file;
  }

  /// Stops the daemon, changes its database, and lets zophotos-web start with that.
  void Craft(const Lines& statements) {
    appliance.Shutdown();
    const Database merged("/shares/A//.zophotos/zophotos.db");
    for (const std::string& sql : statements) {
      merged.Run(sql);
    }
    StopWeb();
    fs::remove_all("/tmp/cache");
    // The daemon's end empties the locator.
    std::ofstream("/tmp/zophotodbmerger.conf") << LocatorOn(a.Path());
    StartWeb();
    const auto end = std::chrono::steady_clock::now() + DEADLINE;
    while (GetJson("/api/status").at("state") != "current" &&
           std::chrono::steady_clock::now() < end) {
      poll(nullptr, 0, 20);
    }
  }

  static inline const std::string ONE = "/shares/A/sea/one.jpg";
};

/// What a volume may have in the place of a file.
class WebSpecialPlaces : public WebHostile, public ::testing::WithParamInterface<SpecialKind> {};

TEST_P(WebSpecialPlaces, AreNeverSent) {
  Write("/tmp/secret", "secret");
  const std::string original = Target(ONE, "/original");
  const std::string rendition = Target(ONE, "/rendition");
  const SpecialFile first(GetParam(), ONE, "/tmp/secret");
  const SpecialFile second(GetParam(), RenditionOf(onA, a.Path(), "sea/one.jpg"), "/tmp/secret");
  for (const std::string& target : {original, rendition}) {
    const HttpResponse response = Get(target);
    EXPECT_EQ(404, response.status) << target;
    EXPECT_THAT(response.body, Not(HasSubstr("secret")));
  }
  EXPECT_EQ("rendition of top.jpg", Get(Target("/shares/A/top.jpg", "/rendition")).body);
}

INSTANTIATE_TEST_SUITE_P(Kinds, WebSpecialPlaces, ::testing::ValuesIn(SPECIAL_KINDS),
                         [](const auto& kind) { return NameOf(kind.param); });

TEST_F(WebHostile, FoldersThatBecomeLinksAreNotFollowed) {
  Write("/tmp/other/one.jpg", "secret");
  const std::string original = Target(ONE, "/original");
  fs::rename("/shares/A/sea", "/shares/A/away");
  fs::create_directory_symlink("/tmp/other", "/shares/A/sea");
  EXPECT_EQ(404, Get(original).status);
  const std::string rendition = Target(ONE, "/rendition");
  fs::rename("/shares/A/.orva/renditions", "/shares/A/renditions");
  fs::create_directory_symlink("../renditions", "/shares/A/.orva/renditions");
  EXPECT_EQ(404, Get(rendition).status);
}

TEST_F(WebHostile, CraftedDatabasesLeadNowhereElse) {
  Write("/tmp/secret.jpg", "secret");
  Write("/shares/secret.jpg", "secret");
  const std::string add =
      "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT folder_id, ";
  const std::string addFolders =
      "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES";
  Craft({"UPDATE Folders SET name = '/shares/A/../../tmp/' WHERE name = '/shares/A/sea/'",
         add + "'../secret.jpg', 5, volume, 6 FROM Folders WHERE name = '/shares/A/'",
         add + "'.orva/orva.db', 5, volume, 6 FROM Folders WHERE name = '/shares/A/'",
         add + "'secret.jpg', 5, '/', 6 FROM Folders WHERE name = '/shares/'",
         addFolders + "(1, '/tmp/', 0, '/tmp/'), (1, '/shares/A/x/', 0, '/shares/')",
         add + "'secret.jpg', 5, volume, 6 FROM Folders WHERE name = '/tmp/'"});
  const Json photos = GetJson("/api/photos").at("photos");
  EXPECT_FALSE(photos.empty());
  for (const Json& photo : photos) {
    const std::string id = photo.at("id");
    for (const char* const file : {"/rendition", "/original"}) {
      const HttpResponse response = Get("/photos/" + id + file);
      EXPECT_THAT(response.body, Not(HasSubstr("secret"))) << photo;
      EXPECT_THAT(response.body, Not(HasSubstr("SQLite format"))) << photo;
    }
    EXPECT_EQ(200, Get("/photos/" + id).status) << photo;
  }
}

TEST_F(WebHostile, ADatabaseThatCannotBeReadIsLoggedOnce) {
  StopWeb();
  fs::remove_all("/tmp/cache");
  appliance.Shutdown();
  Write("/shares/A/.zophotos/zophotos.db", std::string(1000, 'x'));
  std::ofstream("/tmp/zophotodbmerger.conf") << LocatorOn(a.Path());
  web = std::make_unique<Program>(Program::Arguments{ProgramPath("zophotos-web"), "--cache",
                                                     "/tmp/cache", "--listen", "127.0.0.1:0"});
  const Lines lines{web->ReadLine(), web->ReadLine()};
  EXPECT_THAT(lines, ::testing::UnorderedElementsAre(HasSubstr("file is not a database"),
                                                     HasSubstr("listening on")));
  web->Signal(SIGTERM);
  EXPECT_EQ("(end)", web->ReadLine());
}

TEST_F(WebHostile, FoldersOutsideTheTreeAreAtItsTop) {
  Craft({"INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(999, "
         "'/elsewhere/', 0, '/elsewhere/')"});
  const Json folders = GetJson("/api/folders").at("folders");
  ASSERT_EQ(2U, folders.size());
  EXPECT_EQ("/elsewhere/", folders.at(0).at("path"));
  EXPECT_EQ("/shares/", folders.at(1).at("path"));
}

TEST_F(WebHostile, PagesOfFoldersHaveAllFoldersWithTheSamePath) {
  std::string parent = GetJson("/api/folders").at("folders").at(0).at("id");
  const std::string twin = "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) "
                           "SELECT parent_folder_id, name, modified_date, volume FROM Folders "
                           "WHERE name = '/shares/A/sea/' LIMIT 1";
  Craft({twin, twin});
  Lines ids;
  std::string after;
  for (bool more = true; more;) {
    const Json page = GetJson("/api/folders?count=1&parent=" + parent + "&after=" + after);
    more = page.at("more");
    ASSERT_EQ(1U, page.at("folders").size());
    EXPECT_EQ("/shares/A/sea/", page.at("folders").at(0).at("path"));
    after = page.at("folders").at(0).at("id");
    ids.push_back(after);
    ASSERT_LE(ids.size(), 3U);
  }
  EXPECT_EQ(3U, ids.size());
}

TEST_F(WebHostile, VolumesPulledDuringADownloadEndNothingElse) {
  const Volume b("B", "300m");
  Catalog onB(b);
  AddPhoto(onB, b.Path(), "large.jpg", 5, 2010);
  fs::resize_file("/shares/B/large.jpg", 200 << 20);
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(Scanned(b.Path()));
  Merge(b);
  ASSERT_TRUE(AwaitPhotos(4));
  HttpConnection download(port);
  const std::string target = Target("/shares/B/large.jpg", "/original");
  download.Send(HttpGet(target));
  EXPECT_EQ(200, download.ReadHeaders().status);
  // As a disk that is pulled: the files that are open go on without it.
  ASSERT_EQ(0, umount2("/shares/B", MNT_DETACH));
  EXPECT_EQ(404, Get(target).status);
  EXPECT_EQ("rendition of sea/one.jpg", Get(Target(ONE, "/rendition")).body);
  appliance.Handle(Unplugged(b.Path()));
  EXPECT_TRUE(AwaitPhotos(3));
}

TEST_F(WebHostile, DownloadsOfFilesThatBecomeShorterEnd) {
  fs::resize_file(ONE, 100 << 20);
  HttpConnection download(port);
  download.Send(HttpGet(Target(ONE, "/original")));
  EXPECT_EQ(200, download.ReadHeaders().status);
  fs::resize_file(ONE, 10);
  EXPECT_GT(std::size_t{100} << 20, download.ReadToEnd().size());
  EXPECT_EQ(200, Get("/").status);
}

TEST_F(WebHostile, VolumesCanBeUnmountedAfterEachRequest) {
  const Volume b("B", "10m");
  {
    Catalog onB(b);
    onB.Rows().Run("PRAGMA journal_mode = WAL");
    AddPhoto(onB, b.Path(), "b.jpg", 5, 2010);
  }
  appliance.Handle(Plugged(b.Path()));
  appliance.Handle(Scanned(b.Path()));
  Merge(b);
  ASSERT_TRUE(AwaitPhotos(4));
  EXPECT_EQ("rendition of b.jpg", Get(Target("/shares/B/b.jpg", "/rendition")).body);
  EXPECT_EQ("original of b.jpg", Get(Target("/shares/B/b.jpg", "/original")).body);
  EXPECT_THAT(AwaitNothingOpenBelow(b.Path()), IsEmpty());
  appliance.Handle(Unplugged(b.Path()));
  EXPECT_EQ(0, umount("/shares/B"));
}

TEST_F(WebHostile, LockedCatalogsDelayNobody) {
  const std::string target = Target(ONE, "/rendition");
  onA.Rows().Run("PRAGMA journal_mode = DELETE");
  onA.Rows().Run("BEGIN EXCLUSIVE");
  onA.Rows().Run("UPDATE Files SET lastUpdatedDate = 1");
  HttpConnection waiting(port);
  waiting.Send(HttpGet(target));
  EXPECT_EQ(200, Get("/").status);
  EXPECT_EQ(404, waiting.Read().status);
  onA.Rows().Run("ROLLBACK");
}

TEST_F(WebHostile, UsersSeeOnlyWhatTheirServerMayRead) {
  SKIP_WITHOUT_OTHER_USERS();
  const std::string rendition = RenditionOf(onA, a.Path(), "sea/one.jpg");
  fs::permissions(ONE, fs::perms::owner_read);
  fs::permissions(rendition, fs::perms::owner_read);
  StopWeb();
  fs::remove_all("/tmp/cache");
  StartWeb({}, {"setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"});
  ASSERT_TRUE(AwaitPhotos(3));
  EXPECT_EQ("rendition of top.jpg", Get(Target("/shares/A/top.jpg", "/rendition")).body);
  EXPECT_EQ(404, Get(Target(ONE, "/rendition")).status);
  EXPECT_EQ(404, Get(Target(ONE, "/original")).status);
}

TEST_F(WebHostile, LongNamesMakeShortPagesThatLeadToAllPhotos) {
  Craft({"WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 300) "
         "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
         "(SELECT folder_id FROM Folders WHERE name = '/shares/A/'), "
         "i || replace(hex(zeroblob(2000)), '00', char(1, 2)) , i, '/shares/A/', 6 FROM n",
         "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 300) "
         "INSERT INTO Folders(parent_folder_id, name, modified_date, volume) SELECT folder_id, "
         "name || i || replace(hex(zeroblob(1900)), '00', char(1, 2)) || '/', 0, volume FROM "
         "Folders, n WHERE name = '/shares/A/'",
         "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 2000) "
         "INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) SELECT "
         "'/shares/' || i || replace(hex(zeroblob(2000)), '00', char(1, 2)) || '/', 1, 1, 1 "
         "FROM n"});
  constexpr std::size_t most = 2 << 20;
  for (const char* const newest : {"before", "after"}) {
    const std::string direction = newest;
    std::size_t photos = 0;
    std::string id = direction == "before" ? "" : "0";
    for (bool more = true; more;) {
      const HttpResponse response = Get("/api/photos?count=200&" + direction + "=" + id);
      ASSERT_EQ(200, response.status);
      EXPECT_GT(most, response.body.size());
      const Json page = Json::parse(response.body);
      const Json& list = page.at("photos");
      ASSERT_FALSE(list.empty());
      photos += list.size();
      id = (direction == "before" ? list.back() : list.front()).at("id");
      more = page.at("more");
    }
    EXPECT_EQ(303U, photos);
  }
  std::size_t folders = 0;
  std::string query = "?parent=" + std::string(GetJson("/api/folders").at("folders")[0].at("id"));
  std::string after;
  for (bool more = true; more;) {
    const Json page = GetJson("/api/folders" + query + after);
    folders += page.at("folders").size();
    after = "&after=" + std::string(page.at("folders").back().at("id"));
    more = page.at("more");
  }
  EXPECT_EQ(301U, folders);
  const Json volumes = GetJson("/api/volumes");
  EXPECT_TRUE(volumes.at("more"));
  EXPECT_FALSE(volumes.at("volumes").empty());
  EXPECT_THAT(Get("/volumes").body, HasSubstr("There may be more volumes"));
  const std::string folder = query.substr(query.find('=') + 1);
  const std::string words = "/search?words=" + std::string(10'000, 'x') + "&volume=";
  for (const std::string& target :
       {std::string("/"), std::string("/volumes"), std::string("/search?volume=/shares/A/"),
        "/folders/" + folder, std::string("/api/volumes"), words}) {
    const HttpResponse response = Get(target);
    EXPECT_GT(500, response.status) << target.substr(0, 100);
    EXPECT_GT(most, response.body.size()) << target.substr(0, 100);
  }
}

TEST_F(WebHostile, ManyClientsThatDoNotReadTakeLittleMemory) {
  Craft({"WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 300) "
         "INSERT INTO Files(folder_id, name, modified_date, volume, created_date) SELECT "
         "(SELECT folder_id FROM Folders WHERE name = '/shares/A/'), "
         "i || replace(hex(zeroblob(2000)), '00', char(1, 2)) , i, '/shares/A/', 6 FROM n",
         "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 10000) "
         "INSERT INTO Statistics(volume, photos_xcoded, photos_total, last_updated_time) SELECT "
         "'/shares/' || i || replace(hex(zeroblob(2000)), '00', char(1, 2)) || '/', 1, 1, 1 "
         "FROM n"});
  std::string requests;
  for (int i = 0; i < 2; ++i) {
    requests += HttpGet("/api/photos?count=200") + HttpGet("/volumes");
  }
  std::list<HttpConnection> clients;
  for (int i = 0; i < 300; ++i) {
    const int size = 4096;
    setsockopt(clients.emplace_back(port).Socket(), SOL_SOCKET, SO_RCVBUF, &size, sizeof size);
    clients.back().Send(requests);
    if (i % 50 == 0) {
      EXPECT_EQ(200, Get("/api/status").status);
    }
  }
  EXPECT_EQ(200, Get("/api/status").status);
  if (!AreProgramsSanitized()) {
    EXPECT_LT(PeakOf(web->Pid()), 96 << 10);
  }
}

TEST_F(WebHostile, ADatabaseThatTheServerMayNotReadIsNamed) {
  SKIP_WITHOUT_OTHER_USERS();
  const std::string database = "/shares/A/.zophotos/zophotos.db";
  StopWeb();
  fs::remove_all("/tmp/cache");
  const auto expectRefused = [this](const fs::path& path) {
    const fs::perms before = fs::status(path).permissions();
    fs::permissions(path, fs::perms::owner_all);
    StartWeb({}, {"setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"});
    const auto end = std::chrono::steady_clock::now() + DEADLINE;
    while (GetJson("/api/status").at("state") != "failed" &&
           std::chrono::steady_clock::now() < end) {
      poll(nullptr, 0, 20);
    }
    EXPECT_THAT(GetJson("/api/status").at("reason").get<std::string>(),
                HasSubstr("zophotos.db: permission denied: the user of zophotos-web has to be able "
                          "to read this file and to enter all folders above it"));
    fs::permissions(path, before);
    EXPECT_TRUE(AwaitPhotos(3)) << path;
    EXPECT_EQ(0, StopWeb());
    fs::remove_all("/tmp/cache");
  };
  expectRefused(database);
  expectRefused("/shares/A/.zophotos");
  StartWeb();
}

TEST_F(WebHostile, ACacheOfAnotherUserIsRefused) {
  SKIP_WITHOUT_OTHER_USERS();
  const Outcome outcome =
      test::Run({"setpriv", "--reuid=65534", "--regid=65534", "--clear-groups",
                 ProgramPath("zophotos-web"), "--listen", "127.0.0.1:0", "--cache", "/tmp/cache"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_THAT(outcome.error + outcome.output,
              HasSubstr("cannot use the cache directory /tmp/cache: Permission denied"));
}

TEST_F(WebHostile, AThousandConnectionsTakeLittleMemory) {
  std::list<HttpConnection> clients;
  const std::string target = Target(ONE, "/rendition");
  for (int i = 0; i < 1'000; ++i) {
    clients.emplace_back(port).Send(HttpGet(target, "X: " + std::string(10'000, 'x') + "\r\n"));
    EXPECT_EQ(200, clients.back().Read().status);
  }
  EXPECT_EQ(200, Get("/").status);
  if (!AreProgramsSanitized()) {
    EXPECT_LT(PeakOf(web->Pid()), 96 << 10);
  }
}

TEST_F(WebHostile, AddressesOfOtherMachinesAreRefused) {
  const auto run = [](const Program::Arguments& options) {
    Program::Arguments arguments{ProgramPath("zophotos-web"), "--cache", "/tmp/other"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    return test::Run(arguments);
  };
  for (const char* const address : {"0.0.0.0:0", "[::]:0"}) {
    const Outcome outcome = run({"--listen", address});
    EXPECT_EQ(3, outcome.status);
    EXPECT_THAT(outcome.error + outcome.output, HasSubstr("--allow-everybody"));
  }
  EXPECT_EQ(2, run({"--listen", "example.org:80"}).status);
  EXPECT_EQ(2, run({"--host", "a b"}).status);
  EXPECT_EQ(2, run({"--host", "fe80::g"}).status);
  StopWeb();
  fs::remove_all("/tmp/cache");
  web = std::make_unique<Program>(
      Program::Arguments{ProgramPath("zophotos-web"), "--cache", "/tmp/cache", "--listen",
                         "0.0.0.0:0", "--allow-everybody", "--host", "photos.example.org", "--host",
                         "[2001:db8::1]", "--host", "fe80::1"});
  const std::string line = web->ReadLineWith("listening on");
  EXPECT_THAT(line, HasSubstr("http://0.0.0.0:"));
  port = static_cast<std::uint16_t>(std::stoul(line.substr(line.find("0.0.0.0:") + 8)));
  for (const char* const host : {"photos.example.org", "[2001:db8::1]:8480", "[fe80::1]"}) {
    HttpConnection connection(port);
    connection.Send(std::string("GET /api/status HTTP/1.1\r\nHost: ") + host + "\r\n\r\n");
    EXPECT_EQ(200, connection.Read().status) << host;
  }
}

TEST_F(WebHostile, OneCacheHasOneServer) {
  const Outcome outcome =
      test::Run({ProgramPath("zophotos-web"), "--listen", "127.0.0.1:0", "--cache", "/tmp/cache"});
  EXPECT_EQ(1, outcome.status);
  EXPECT_TRUE(AwaitPhotos(3));
}

TEST_F(WebHostile, SocketsOfSystemdAreServed) {
  StopWeb();
  web = std::make_unique<Program>(
      Program::Arguments{"systemd-socket-activate", "--listen=127.0.0.1:8480",
                         ProgramPath("zophotos-web"), "--cache", "/tmp/cache"});
  web->ReadLineWith("Listening on");
  port = 8480;
  EXPECT_TRUE(AwaitPhotos(3));
}

} // namespace
} // namespace orva::test
