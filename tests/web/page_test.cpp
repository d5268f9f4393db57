// The HTML of all views: no name changes the markup, and every view says what it has to.

#include "zophotos-web/Assets.h"
#include "zophotos-web/Page.h"

#include "zophotos/Activity.h"
#include "zophotos/Text.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <limits>
#include <optional>
#include <regex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace orva::web {
namespace {

using namespace std::string_literals;
using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

Photo MakePhoto(PhotoId id, const std::string& name) {
  return {.id = id,
          .folder = 7,
          .path = "/shares/Photos/" + name + "/" + name,
          .name = name,
          .volume = "/shares/" + name + "/",
          .modified = 1'790'000'000 - id};
}

Volume MakeVolume(const std::string& name, std::int64_t transcoded, std::int64_t total) {
  Volume volume;
  volume.mountPoint = "/shares/" + name + "/";
  volume.isMerged = true;
  volume.transcoded = transcoded;
  volume.total = total;
  return volume;
}

Site MakeSite(const std::string& name) {
  Site site;
  site.snapshot.state = SnapshotStatus::State::Failed;
  site.snapshot.reason = name;
  site.volumes = {MakeVolume(name, 1, 2), MakeVolume(name, 2, 2)};
  site.volumes[0].activity = name;
  site.volumes[1].isGone = true;
  return site;
}

PhotoList MakeList(const std::string& name) {
  return {.photos = {MakePhoto(9, name), MakePhoto(8, name)}, .hasNewer = true, .hasOlder = true};
}

Selection MakeSelection(const std::string& name) {
  Selection selection;
  selection.words = name;
  selection.volume = "/shares/" + name + "/";
  return selection;
}

Folder MakeFolder(std::int64_t id, const std::string& name) {
  return {.id = id,
          .parent = 1,
          .path = "/shares/" + name + "/",
          .volume = "/shares/" + name + "/",
          .hasFolders = true,
          .hasPhotos = true};
}

/// A view with this name in every place that has a text.
struct View {
  const char* name;
  std::function<std::string(const std::string& name)> make;
};

void PrintTo(const View& view, std::ostream* output) {
  *output << view.name;
}

const std::vector<View> VIEWS = {
    {"Newest", [](const auto& name) { return NewestPage(MakeSite(name), MakeList(name)); }},
    {"Search",
     [](const auto& name) {
       return SearchPage(MakeSite(name), MakeSelection(name), {{.year = 2026, .month = 11}},
                         MakeList(name));
     }},
    {"Folder",
     [](const auto& name) {
       return FolderPage(MakeSite(name), {.folder = MakeFolder(3, name),
                                          .ancestors = {MakeFolder(2, name)},
                                          .folders = {MakeFolder(4, name), MakeFolder(5, name)},
                                          .hasMoreFolders = true,
                                          .list = MakeList(name)});
     }},
    {"Photo",
     [](const auto& name) {
       return PhotoPage(
           MakeSite(name),
           {.photo = MakePhoto(5, name), .selection = MakeSelection(name), .newer = 6, .older = 4});
     }},
    {"Volumes", [](const auto& name) { return VolumesPage(MakeSite(name)); }},
    {"Error", [](const auto& name) { return ErrorPage(404, name); }}};

/// The length of the tag that html begins with, and the tag with the names of its attributes;
/// nothing for what is no strict markup. The values are skipped without a regular expression:
/// std::regex takes stack for each of their characters.
std::optional<std::pair<std::size_t, std::string>> ReadTag(std::string_view html) {
  static const std::regex start("<(!doctype html|/?[a-z][a-z0-9]*)");
  static const std::regex attribute(" [a-zA-Z-]+");
  static const std::regex end("/?>");
  std::size_t at = 0;
  std::cmatch match;
  const auto reads = [&html, &at, &match](const std::regex& part) {
    if (!std::regex_search(html.data() + at, html.data() + html.size(), match, part,
                           std::regex_constants::match_continuous)) {
      return false;
    }
    at += static_cast<std::size_t>(match.length());
    return true;
  };
  if (!reads(start)) {
    return std::nullopt;
  }
  std::string tag = match[1].str();
  while (reads(attribute)) {
    tag += match.str();
    if (html.substr(at).starts_with("=\"")) {
      at = html.find_first_of("\"<>", at + 2);
      if (at == std::string_view::npos || html[at] != '"') {
        return std::nullopt;
      }
      ++at;
    }
  }
  return reads(end) ? std::optional(std::pair(at, tag)) : std::nullopt;
}

/// All tags of a document, with the names of their attributes. Fails for what is no strict markup.
std::vector<std::string> TagsOf(const std::string& html) {
  std::vector<std::string> tags;
  std::size_t at = 0;
  while ((at = html.find_first_of("<>", at)) != std::string::npos) {
    const auto tag = ReadTag(std::string_view(html).substr(at));
    if (!tag) {
      ADD_FAILURE() << "no markup: " << html.substr(at, 200);
      return tags;
    }
    at += tag->first;
    tags.push_back(tag->second);
  }
  return tags;
}

/// The mark that shows what follows from right to left; in two parts for those who read this.
const std::string REVERSED = "\xe2\x80"s + "\xae"s;

const std::vector<std::string> HOSTILE_NAMES = {
    "<script>alert(1)</script>",
    "\"><img src=x onerror=alert(1)>",
    "' onmouseover='alert(1)",
    "\" autofocus onfocus=\"alert(1)",
    "</title></template></bdi><style>*{display:none}</style>",
    "&lt;b&gt; &amp; &#60;i&#62;",
    "--><!--",
    "javascript:alert(1)",
    "line\nbreak\r\ttab",
    REVERSED + "gpj.exe",
    "\xe2\x81"s + "\xa6\xe2\x80"s + "\x8f\xef\xbb\xbf"s,
    "\xff\xfe\xc0\xbc script \xc3",
    "nul\0inside"s,
    "\x1b[31m\x7f\xc2\x9b",
    "\\x3cb\\x3e",
    std::string(4096, 'a'),
    std::string(4096, '<')};

class PageOfHostileNames : public ::testing::TestWithParam<View> {};

TEST_P(PageOfHostileNames, HasTheSameMarkupAsWithAHarmlessName) {
  for (const std::string& name : HOSTILE_NAMES) {
    // Links can have any bytes, but forms cannot send what is not UTF-8.
    const std::string alike = zophotos::ToUtf8(name) == name ? "harmless" : "harmless\xff";
    const std::vector<std::string> expected = TagsOf(GetParam().make(alike));
    ASSERT_FALSE(expected.empty());
    EXPECT_EQ(TagsOf(GetParam().make(name)), expected) << name;
  }
}

TEST_P(PageOfHostileNames, IsUtf8WithoutControlCharacters) {
  for (const std::string& name : HOSTILE_NAMES) {
    const std::string html = GetParam().make(name);
    EXPECT_EQ(zophotos::ToUtf8(html), html) << name;
    EXPECT_THAT(html, AllOf(Not(HasSubstr("\x1b")), Not(HasSubstr("\x7f")), Not(HasSubstr("\0"s))));
  }
}

TEST_P(PageOfHostileNames, ShowsNoDirectionMarks) {
  static const std::regex typed(R"(id="words"[^>]*value="[^"]*"|<option value="[^"]*")");
  EXPECT_THAT(std::regex_replace(GetParam().make("a" + REVERSED + "gpj.exe"), typed, ""),
              Not(HasSubstr(REVERSED)));
}

TEST_P(PageOfHostileNames, HasNoInlineCodeOrStyle) {
  for (const std::string& tag : TagsOf(GetParam().make("harmless"))) {
    EXPECT_FALSE(tag.starts_with("style") || tag.find(" style") != std::string::npos) << tag;
    EXPECT_EQ(tag.find(" on"), std::string::npos) << tag;
    EXPECT_TRUE(!tag.starts_with("script") || tag == "script src type") << tag;
  }
}

INSTANTIATE_TEST_SUITE_P(Views, PageOfHostileNames, ::testing::ValuesIn(VIEWS),
                         [](const auto& parameter) { return parameter.param.name; });

TEST(NewestPage, ShowsEachPhotoWithItsNameAndTheWayOn) {
  const PhotoList list{.photos = {MakePhoto(9, "sea.jpg"), MakePhoto(-8, "a & b.jpg")},
                       .hasNewer = false,
                       .hasOlder = true};
  const std::string html = NewestPage({}, list);
  EXPECT_THAT(html,
              HasSubstr("href=\"/photos/9\"><img src=\"/photos/9/rendition\" alt=\"sea.jpg\""));
  EXPECT_THAT(html, HasSubstr("alt=\"a &amp; b.jpg\""));
  EXPECT_THAT(html, HasSubstr("href=\"/?before=-8\">Older photos"));
  EXPECT_THAT(html, Not(HasSubstr("Newer photos")));
}

TEST(NewestPage, GroupsPhotosByMonth) {
  Photo november = MakePhoto(3, "november.jpg");
  november.modified = 1'794'830'400; // 2026-11-16
  Photo october = MakePhoto(2, "october.jpg");
  october.modified = november.modified - std::int64_t{31} * 86'400;
  Photo never = MakePhoto(1, "never.jpg");
  never.modified = std::numeric_limits<std::int64_t>::max();
  const std::string html = NewestPage({}, {.photos = {november, november, october, never}});
  std::vector<std::string> months;
  static const std::regex heading("<h2>([^<]*)</h2><ol");
  for (std::sregex_iterator match(html.begin(), html.end(), heading), end; match != end; ++match) {
    months.push_back((*match)[1]);
  }
  EXPECT_THAT(months, ElementsAre("November 2026", "October 2026", "Other times"));
}

TEST(NewestPage, SaysWhatToDoWhenThereAreNoPhotos) {
  Site site;
  site.snapshot.state = SnapshotStatus::State::Current;
  EXPECT_THAT(NewestPage(site, {}), HasSubstr("Copy photos to <code>/shares/Photos</code>"));
  site.volumes = {MakeVolume("Photos", 0, 12)};
  EXPECT_THAT(NewestPage(site, {}), HasSubstr("The photos are being prepared"));
  site.snapshot.state = SnapshotStatus::State::Building;
  EXPECT_THAT(NewestPage(site, {}), HasSubstr("as soon as their list is built"));
}

TEST(Page, SaysWhatIsWrongWithTheDatabase) {
  Site site;
  site.snapshot = {
      .state = SnapshotStatus::State::Building, .done = 1234, .total = 56789, .reason = {}};
  EXPECT_THAT(VolumesPage(site), HasSubstr("being built: 1,234 of about 56,789."));
  site.snapshot = {.state = SnapshotStatus::State::NoDatabase, .reason = "no <master>"};
  EXPECT_THAT(VolumesPage(site), HasSubstr("<p>no &lt;master&gt;</p>"));
  site.snapshot.reason = {};
  EXPECT_THAT(VolumesPage(site), HasSubstr("<p>There is no merged database at the moment.</p>"));
  site.snapshot.state = SnapshotStatus::State::Current;
  EXPECT_THAT(VolumesPage(site), Not(HasSubstr("at the moment")));
}

TEST(SearchPage, KeepsWhatWasAskedFor) {
  Selection selection;
  selection.words = "\"sea\" \\ <b>";
  selection.volume = "/shares/Camera/";
  selection.year = 2026;
  selection.month = 11;
  const std::string html =
      SearchPage({.snapshot = {}, .volumes = {MakeVolume("Photos", 1, 1)}}, selection,
                 {{.year = 2026, .month = 12}, {.year = 2026, .month = 11}}, {});
  EXPECT_THAT(html, HasSubstr("value=\"&quot;sea&quot; \\ &lt;b&gt;\""));
  EXPECT_THAT(html, HasSubstr("<option value=\"/shares/Camera/\" selected>/shares/Camera/"));
  EXPECT_THAT(html, HasSubstr("<option value=\"2026-11\" selected>November 2026"));
  EXPECT_THAT(html, HasSubstr("<option value=\"2026\">2026"));
  EXPECT_THAT(html, HasSubstr("No photo matches."));
}

TEST(SearchPage, OffersTheMonthsWhenNothingIsAskedFor) {
  const std::string html = SearchPage({}, {}, {{.year = 2026, .month = 11}}, {});
  EXPECT_THAT(html, HasSubstr("<a href=\"/search?month=2026-11\">November</a>"));
  EXPECT_THAT(html, Not(HasSubstr("No photo matches.")));
}

TEST(SearchPage, SaysWhatToDoIfThereAreNoPhotos) {
  EXPECT_THAT(SearchPage({}, {}, {}, {}), HasSubstr("id=\"empty\""));
  EXPECT_THAT(SearchPage({}, {}, {{.year = 2026, .month = 11}}, {}),
              Not(HasSubstr("id=\"empty\"")));
}

TEST(SearchPage, OffersOnlyVolumesThatAFormCanSend) {
  const std::string html = SearchPage(
      {.snapshot = {}, .volumes = {MakeVolume("a\xff", 1, 1), MakeVolume("b", 1, 1)}}, {}, {}, {});
  EXPECT_THAT(html, HasSubstr("<option value=\"/shares/b/\">"));
  EXPECT_THAT(html, Not(HasSubstr("<option value=\"/shares/a")));
}

TEST(FolderPage, LeadsUpAndDown) {
  Folder top = MakeFolder(1, "");
  top.parent = -1;
  top.path = "/shares/";
  const std::string html = FolderPage({}, {.folder = MakeFolder(3, "Photos/Sea"),
                                           .ancestors = {top, MakeFolder(2, "Photos")},
                                           .folders = {MakeFolder(4, "Photos/Sea/Bergen")},
                                           .hasMoreFolders = true,
                                           .list = {}});
  EXPECT_THAT(html, HasSubstr("<a href=\"/folders\">Folders</a>"));
  EXPECT_THAT(html, HasSubstr("<a href=\"/folders/2\"><bdi>Photos</bdi></a>"));
  EXPECT_THAT(html, Not(HasSubstr("href=\"/folders/1\"")));
  EXPECT_THAT(html, HasSubstr("<h1><bdi>Sea</bdi></h1>"));
  EXPECT_THAT(html, HasSubstr("<bdi>Bergen</bdi>"));
  EXPECT_THAT(html, HasSubstr("href=\"/folders/3?after_folder=4\""));
  EXPECT_THAT(html, HasSubstr("There are no photos directly in this folder."));
}

TEST(PhotoPage, LeadsToItsNeighboursInTheListThatItCameFrom) {
  Selection selection;
  selection.folder = 7;
  const std::string html = PhotoPage(
      {},
      {.photo = MakePhoto(5, "a.jpg"), .selection = selection, .newer = std::nullopt, .older = -4});
  EXPECT_THAT(html, HasSubstr("aria-label=\"Newer photo\" hidden"));
  EXPECT_THAT(html, HasSubstr("aria-label=\"Older photo\" href=\"/photos/-4?folder=7\""));
  EXPECT_THAT(html, HasSubstr("close\" href=\"/folders/7\""));
  EXPECT_THAT(html, HasSubstr("href=\"/photos/5/original\" download"));
  EXPECT_THAT(html, HasSubstr("src=\"/photos/5/rendition\""));
}

TEST(VolumesPage, ShowsHowFarEachVolumeIs) {
  Volume busy = MakeVolume("Busy", 199'999, 200'000);
  busy.failed = 3;
  busy.activity = "being indexed";
  Volume crafted = MakeVolume("Crafted", std::numeric_limits<std::int64_t>::max(), -5);
  Volume gone = MakeVolume("Gone", 0, 10);
  gone.isGone = true;
  const std::string html = VolumesPage({.snapshot = {}, .volumes = {busy, crafted, gone}});
  EXPECT_THAT(html, HasSubstr("max=\"200000\" value=\"199999\""));
  EXPECT_THAT(html, HasSubstr(">99 %<")); // not 100 before all are
  EXPECT_THAT(html, HasSubstr("<b>3</b> failed"));
  EXPECT_THAT(html, HasSubstr("max=\"1\" value=\"0\""));
  EXPECT_THAT(html, HasSubstr("<li class=\"volume gone\" data-volume=\"/shares/Gone/\">"));
}

TEST(Address, EncodesEveryByteThatIsNotPlain) {
  Selection selection;
  selection.words = "a b&c=\"\xff";
  selection.volume = "/shares/Photos/";
  selection.folder = -3;
  selection.year = 987;
  EXPECT_EQ(Address("/search", selection),
            "/search?words=a%20b%26c%3D%22%FF&volume=%2Fshares%2FPhotos%2F&folder=-3&month=0987");
  EXPECT_EQ(Address("/search", {}), "/search");
  EXPECT_EQ(WithParameter("/?a=b", "before", "-1"), "/?a=b&before=-1");
}

TEST(Combine, AddsWhatTheServicesDoToTheVolumes) {
  zophotos::Activity services;
  services.indexer.emplace();
  (*services.indexer)["/shares/Photos/"] = {.state = "walking", .foldersWaiting = 12};
  (*services.indexer)["/shares/a\uFFFD/"] = {.state = "watching", .foldersWaiting = 0};
  (*services.indexer)["/shares/New/"] = {.state = "walking", .foldersWaiting = 1};
  const std::vector<Volume> volumes =
      Combine({{.mountPoint = "/shares/Photos/", .transcoded = 1, .total = 2, .mergedUpTo = 3},
               {.mountPoint = "/shares/a\xff/", .isGone = true}},
              services);
  ASSERT_EQ(volumes.size(), 3U);
  EXPECT_EQ(volumes[0].mountPoint, "/shares/New/");
  EXPECT_FALSE(volumes[0].isMerged);
  EXPECT_EQ(volumes[1].total, 2);
  EXPECT_EQ(volumes[1].foldersWaiting, 12);
  EXPECT_EQ(volumes[1].waiting, std::nullopt);
  EXPECT_THAT(volumes[1].activity, HasSubstr("12 folders waiting"));
  EXPECT_TRUE(volumes[2].isGone);
  EXPECT_EQ(volumes[2].state, "watching");
  EXPECT_EQ(volumes[2].activity, "");
}

TEST(FindAsset, HasTheFilesOfAllPages) {
  for (const char* const path : {"/icon.svg", "/script.js", "/style.css"}) {
    const Asset* const asset = FindAsset(path);
    ASSERT_NE(asset, nullptr) << path;
    EXPECT_FALSE(asset->content.empty());
    EXPECT_EQ(asset->etag.size(), 18U);
  }
  EXPECT_EQ(FindAsset("/style.css")->type, "text/css; charset=utf-8");
  EXPECT_EQ(FindAsset("/script.js")->type, "text/javascript; charset=utf-8");
  EXPECT_EQ(FindAsset("/"), nullptr);
  EXPECT_EQ(FindAsset("/style.css/"), nullptr);
}

} // namespace
} // namespace orva::web
