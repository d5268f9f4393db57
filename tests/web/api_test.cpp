// The JSON interface and the files of photos, as other programs use them.

#include "WebTest.h"

#include "tools/ServiceFiles.h"

#include <filesystem>

namespace orva::test {
namespace {

namespace fs = std::filesystem;
using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class WebApi : public WebTest {
protected:
  /// A stream of events that has sent its first one.
  std::unique_ptr<HttpConnection> OpenEvents() const {
    auto events = std::make_unique<HttpConnection>(port);
    events->Send(HttpGet("/api/events"));
    EXPECT_EQ("text/event-stream", events->ReadHeaders().Header("content-type"));
    events->ReadUntil("event: change\ndata: ");
    return events;
  }
};

TEST_F(WebApi, ListsPhotosFromTheNewest) {
  EXPECT_THAT(Paths(), ElementsAre("/shares/A/sea/deep/two.jpg", "/shares/A/sea/one.jpg",
                                   "/shares/A/top.jpg"));
  const Json photo = GetJson("/api/photos?count=1").at("photos").at(0);
  EXPECT_EQ("two.jpg", photo.at("name"));
  EXPECT_EQ("/shares/A/", photo.at("volume"));
  EXPECT_EQ("2001-09-09T01:46:42Z", photo.at("modified"));
  EXPECT_EQ("2001-09-09 01:46:42", photo.at("local_time"));
}

TEST_F(WebApi, PagesInBothDirections) {
  const Json first = GetJson("/api/photos?count=2");
  EXPECT_TRUE(first.at("more"));
  const std::string last = first.at("photos").at(1).at("id");
  EXPECT_THAT(Paths("?count=2&before=" + last), ElementsAre("/shares/A/top.jpg"));
  EXPECT_FALSE(GetJson("/api/photos?count=2&before=" + last).at("more"));
  EXPECT_THAT(Paths("?count=1&after=" + last), ElementsAre("/shares/A/sea/deep/two.jpg"));
  EXPECT_FALSE(GetJson("/api/photos?count=1&after=" + last).at("more"));
  const std::string oldest = IdOf("/shares/A/top.jpg");
  EXPECT_THAT(Paths("?count=1&after=" + oldest), ElementsAre("/shares/A/sea/one.jpg"));
  EXPECT_TRUE(GetJson("/api/photos?count=1&after=" + oldest).at("more"));
}

TEST_F(WebApi, SelectsByWordsVolumeFolderAndMonth) {
  EXPECT_THAT(Paths("?words=sea"),
              ElementsAre("/shares/A/sea/deep/two.jpg", "/shares/A/sea/one.jpg"));
  EXPECT_THAT(Paths("?words=SEA+on"), ElementsAre("/shares/A/sea/one.jpg"));
  EXPECT_THAT(Paths("?words=absent"), IsEmpty());
  EXPECT_THAT(Paths("?words=/shares/A/sea/one.jpg"), ElementsAre("/shares/A/sea/one.jpg"));
  EXPECT_EQ(3U, Paths("?words=shares").size());
  EXPECT_THAT(Paths("?volume=/shares/B/"), IsEmpty());
  EXPECT_EQ(3U, Paths("?volume=/shares/A/").size());
  EXPECT_EQ(3U, Paths("?month=2001-09").size());
  EXPECT_EQ(3U, Paths("?year=2001").size());
  EXPECT_THAT(Paths("?month=2001-10"), IsEmpty());
  const std::string folder = GetJson("/api/photos/" + IdOf("/shares/A/sea/one.jpg")).at("folder");
  EXPECT_THAT(Paths("?folder=" + folder), ElementsAre("/shares/A/sea/one.jpg"));
}

TEST_F(WebApi, NamesTheNeighboursOfAPhoto) {
  const Json photo = GetJson("/api/photos/" + IdOf("/shares/A/sea/one.jpg"));
  EXPECT_EQ(IdOf("/shares/A/sea/deep/two.jpg"), photo.at("newer"));
  EXPECT_EQ(IdOf("/shares/A/top.jpg"), photo.at("older"));
  const Json found = GetJson("/api/photos/" + IdOf("/shares/A/sea/one.jpg") + "?words=sea");
  EXPECT_TRUE(found.at("older").is_null());
}

TEST_F(WebApi, ListsFoldersAndTheirAncestors) {
  std::string parent;
  Lines paths;
  for (int i = 0; i < 3; ++i) {
    const Json folders = GetJson("/api/folders?parent=" + parent).at("folders");
    ASSERT_EQ(1U, folders.size());
    paths.push_back(folders.at(0).at("path"));
    parent = folders.at(0).at("id");
  }
  EXPECT_THAT(paths, ElementsAre("/shares/A/", "/shares/A/sea/", "/shares/A/sea/deep/"));
  const Json folder = GetJson("/api/folders/" + parent);
  EXPECT_EQ("deep", folder.at("name"));
  EXPECT_TRUE(folder.at("has_photos"));
  EXPECT_FALSE(folder.at("has_folders"));
  EXPECT_EQ(3U, folder.at("ancestors").size());
  EXPECT_EQ("/shares/", folder.at("ancestors").at(0).at("path"));
  EXPECT_THAT(Get("/folders").body, HasSubstr("<bdi>A</bdi>"));
}

TEST_F(WebApi, ListsVolumesWithTheirProgress) {
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A", "5", "1", "true"));
  const Json volumes = GetJson("/api/volumes").at("volumes");
  ASSERT_EQ(1U, volumes.size());
  EXPECT_EQ("/shares/A/", volumes.at(0).at("volume"));
  EXPECT_EQ(3, volumes.at(0).at("transcoded"));
  EXPECT_EQ(3, volumes.at(0).at("total"));
  EXPECT_EQ(5, volumes.at(0).at("waiting"));
  EXPECT_EQ(1, volumes.at(0).at("failed"));
  EXPECT_TRUE(volumes.at(0).at("rendering"));
  EXPECT_TRUE(volumes.at(0).at("state").is_null());
}

TEST_F(WebApi, ListsMonthsAndTheStatus) {
  EXPECT_EQ(R"({"months":[{"year":2001,"month":9}]})", GetJson("/api/months").dump());
  EXPECT_EQ("current", GetJson("/api/status").at("state"));
}

TEST_F(WebApi, TellsOfMergesAndOfTheServices) {
  const auto events = OpenEvents();
  AddPhoto(onA, a.Path(), "new.jpg", 1'000'000'003, 2003);
  Merge(a);
  events->ReadUntil("event: change\ndata: ");
  EXPECT_EQ("/shares/A/new.jpg", Paths().at(0));
  WriteVolumes(TRANSCODER_FOLDER, TranscoderVolume("/shares/A", "5", "1", "true"));
  events->ReadUntil("event: volumes\n");
}

TEST_F(WebApi, TellsThatTheSnapshotIsBuilt) {
  const auto events = OpenEvents();
  const std::string database = "/shares/A/.zophotos/zophotos.db";
  fs::copy_file(database, database + ".copy");
  fs::rename(database + ".copy", database);
  events->ReadUntil("event: volumes\n");
  events->ReadUntil("event: change\n");
  EXPECT_TRUE(AwaitPhotos(3));
}

TEST_F(WebApi, ForgetsTheDatabaseOfAnUnpluggedMaster) {
  const auto events = OpenEvents();
  appliance.Handle(Unplugged(a.Path()));
  EXPECT_TRUE(AwaitPhotos(0));
  events->ReadUntil("event: change\n");
}

TEST_F(WebApi, RefusesUnknownIdsAndMalformedQueries) {
  const std::vector<std::pair<std::string, int>> expected{
      {"/api/photos/1", 404},          {"/api/photos/x", 404},
      {"/api/photos/", 404},           {"/api/photos/01", 404},
      {"/api/photos/1/", 404},         {"/api/photos/..", 404},
      {"/api/folders/99999", 404},     {"/api/folders/-", 404},
      {"/api/nothing", 404},           {"/api/", 404},
      {"/api/photos?count=0", 400},    {"/api/photos?count=201", 400},
      {"/api/photos?before=x", 400},   {"/api/photos?before=1&after=2", 400},
      {"/api/photos?month=13", 400},   {"/api/folders?parent=x", 400},
      {"/api/photos?words=%zz", 400},  {"/api/photos?folder=1e3", 400},
      {"/api/folders?after=9999", 404}};
  for (const auto& [target, status] : expected) {
    const HttpResponse response = Get(target);
    EXPECT_EQ(status, response.status) << target;
    EXPECT_TRUE(Json::parse(response.body).contains("error")) << target;
  }
  for (const char* const target :
       {"/photos/1", "/photos/x", "/photos/", "/photos/1/rendition", "/photos/1/original",
        "/folders/99999", "/folders/x", "/folders?after_folder=99999", "/nothing", "//",
        "/../etc/passwd", "/photos/../../etc", "/photos/%2e%2e/%2e%2e", "/style.css/", "/.",
        "/photos/1/rendition/../original"}) {
    const HttpResponse response = Get(target);
    EXPECT_EQ(404, response.status) << target;
    EXPECT_THAT(response.Header("content-type"), HasSubstr("text/html")) << target;
  }
}

TEST_F(WebApi, SendsRenditionsAsImages) {
  const std::string target = "/photos/" + IdOf("/shares/A/sea/one.jpg") + "/rendition";
  const HttpResponse response = Get(target);
  EXPECT_EQ(200, response.status);
  EXPECT_EQ("rendition of sea/one.jpg", response.body);
  EXPECT_EQ("image/jpeg", response.Header("content-type"));
  EXPECT_EQ("private, no-cache", response.Header("cache-control"));
  const std::string tag = response.Header("etag");
  EXPECT_EQ(304, Get(target, "If-None-Match: " + tag + "\r\n").status);
  Write(RenditionOf(onA, a.Path(), "sea/one.jpg"), "another rendition");
  EXPECT_EQ("another rendition", Get(target, "If-None-Match: " + tag + "\r\n").body);
  EXPECT_THAT(AwaitNothingOpenBelow(a.Path() + "/.orva"), IsEmpty());
}

TEST_F(WebApi, SendsOriginalsAsAttachments) {
  const std::string target = "/photos/" + IdOf("/shares/A/sea/one.jpg") + "/original";
  const HttpResponse response = Get(target);
  EXPECT_EQ("original of sea/one.jpg", response.body);
  EXPECT_EQ("application/octet-stream", response.Header("content-type"));
  EXPECT_EQ("attachment; filename=\"one.jpg\"; filename*=UTF-8''one.jpg",
            response.Header("content-disposition"));
  const HttpResponse part = Get(target, "Range: bytes=12-14\r\n");
  EXPECT_EQ(206, part.status);
  EXPECT_EQ("sea", part.body);
  EXPECT_EQ("bytes 12-14/23", part.Header("content-range"));
  EXPECT_EQ(416, Get(target, "Range: bytes=99-\r\n").status);
  EXPECT_EQ(200, Get(target, "Range: bytes=0-1,3-4\r\n").status);
  EXPECT_EQ(206,
            Get(target, "Range: bytes=0-1\r\nIf-Range: " + part.Header("etag") + "\r\n").status);
  EXPECT_EQ(200, Get(target, "Range: bytes=0-1\r\nIf-Range: \"other\"\r\n").status);
  EXPECT_EQ(304, Get(target, "If-None-Match: " + part.Header("etag") + "\r\n").status);
}

TEST_F(WebApi, ServesPagesAndAssets) {
  const std::string id = IdOf("/shares/A/sea/one.jpg");
  for (const std::string& target :
       {std::string("/"), std::string("/search?words=sea"), std::string("/search?words=&volume="),
        std::string("/folders"), "/photos/" + id, std::string("/volumes"),
        "/folders/" + GetJson("/api/photos/" + id).at("folder").get<std::string>()}) {
    const HttpResponse response = Get(target);
    EXPECT_EQ(200, response.status) << target;
    EXPECT_EQ("text/html; charset=utf-8", response.Header("content-type"));
    EXPECT_EQ("no-store", response.Header("cache-control"));
    EXPECT_THAT(response.body, AllOf(HasSubstr("<!doctype html>"), HasSubstr("</html>")));
  }
  for (const char* const target : {"/style.css", "/script.js", "/icon.svg"}) {
    const HttpResponse response = Get(target);
    EXPECT_EQ(200, response.status);
    EXPECT_EQ(304, Get(target, "If-None-Match: " + response.Header("etag") + "\r\n").status);
  }
}

TEST_F(WebApi, ContinuesWithItsSnapshotAfterARestart) {
  const auto version = GetJson("/api/status").at("version").get<std::int64_t>();
  EXPECT_EQ(0, StopWeb());
  StartWeb();
  EXPECT_TRUE(AwaitPhotos(3));
  EXPECT_GE(GetJson("/api/status").at("version").get<std::int64_t>(), version);
}

} // namespace
} // namespace orva::test
