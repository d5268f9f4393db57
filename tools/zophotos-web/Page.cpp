#include "zophotos-web/Page.h"

#include "zophotos-web/Html.h"

#include "zophotos/Text.h"

#include <algorithm>
#include <array>
#include <string_view>
#include <utility>

namespace orva::web {

namespace {

constexpr std::array<const char*, 12> MONTHS = {"January",   "February", "March",    "April",
                                                "May",       "June",     "July",     "August",
                                                "September", "October",  "November", "December"};

/// The most volumes that the newest page shows above the photos.
constexpr std::size_t MOST_IN_STRIP = 24;

enum class Section { Photos, Folders, Volumes, Search, None };

Html Icon(std::string_view name) {
  Html html;
  html << R"(<svg class="icon" viewBox="0 0 24 24" aria-hidden="true" focusable="false"><path d=")";
  if (name == "folder") {
    html << "M3 6.5A1.5 1.5 0 0 1 4.5 5h4.2l2 2.5h8.8A1.5 1.5 0 0 1 21 9v8.5a1.5 1.5 0 0 1-1.5 1.5h"
            "-15A1.5 1.5 0 0 1 3 17.5z";
  } else if (name == "search") {
    html << "M10.5 4a6.5 6.5 0 1 0 0 13 6.5 6.5 0 0 0 0-13zM15.5 15.5L20 20";
  } else if (name == "newer") {
    html << "M15 5l-7 7 7 7";
  } else if (name == "older") {
    html << "M9 5l7 7-7 7";
  } else if (name == "close") {
    html << "M6 6l12 12M18 6L6 18";
  } else if (name == "download") {
    html << "M12 4v11m0 0l-4.5-4.5M12 15l4.5-4.5M5 19.5h14";
  } else if (name == "disk") {
    html
        << "M5.5 5h13L21 14v3.5a1.5 1.5 0 0 1-1.5 1.5h-15A1.5 1.5 0 0 1 3 17.5V14zM3 14h18M17 16.5h.01";
  }
  html << R"("/></svg>)";
  return html;
}

/// "1,234,567".
std::string Grouped(std::int64_t number) {
  std::string text = std::to_string(number);
  const std::size_t first = number < 0 ? 1 : 0;
  for (std::size_t place = text.size(); place > first + 3;) {
    place -= 3;
    text.insert(place, ",");
  }
  return text;
}

/// The last component of a folder's path.
std::string_view LastComponent(std::string_view path) {
  while (path.size() > 1 && path.ends_with('/')) {
    path.remove_suffix(1);
  }
  const std::size_t separator = path.rfind('/');
  return path.size() > 1 && separator != std::string_view::npos ? path.substr(separator + 1) : path;
}

/// "2026-11" in local time; empty for a time outside the calendar.
std::string MonthKey(std::int64_t seconds) {
  const std::string time = zophotos::LocalTime(seconds);
  return time.size() == 19 && time[4] == '-' && time[10] == ' ' ? time.substr(0, 7) : "";
}

/// "November 2026" for "2026-11".
std::string MonthTitle(const std::string& key) {
  return key.empty() ? "Other times"
                     : MONTHS.at(std::stoul(key.substr(5)) - 1) + (" " + key.substr(0, 4));
}

std::string PhotoAddress(PhotoId id, const Selection& selection) {
  return Address("/photos/" + std::to_string(id), selection);
}

std::string VolumeAddress(const std::string& mountPoint) {
  return Address("/search",
                 {.words = {}, .volume = mountPoint, .folder = {}, .year = {}, .month = {}});
}

/// The address of the list that a selection describes.
std::string ListAddress(const Selection& selection) {
  if (selection.folder) {
    return "/folders/" + std::to_string(*selection.folder);
  }
  return selection == Selection() ? "/" : Address("/search", selection);
}

/// What keeps the photos from being shown as they are; empty if nothing does.
Html Notice(const SnapshotStatus& status) {
  Html html;
  switch (status.state) {
  case SnapshotStatus::State::Building:
    html << "<p>The list of photos is being built";
    if (status.total > 0) {
      html << ": " << Grouped(status.done) << " of about " << Grouped(status.total);
    }
    html << ".</p>";
    break;
  case SnapshotStatus::State::Failed:
    html << "<p>The merged database cannot be read, so this page may be out of date: "
         << NameText(status.reason) << "</p>";
    break;
  case SnapshotStatus::State::NoDatabase:
    html << "<p>"
         << (status.reason.empty() ? "There is no merged database at the moment."
                                   : NameText(status.reason))
         << "</p>";
    break;
  case SnapshotStatus::State::Current:
    break;
  }
  return html;
}

Html Link(Section section, Section here, const std::string& address, const std::string& text) {
  Html html;
  html << "<li><a href=\"" << address << "\"";
  if (section == here) {
    html << " aria-current=\"true\"";
  }
  html << ">" << text << "</a></li>";
  return html;
}

/// The search field above every page but the search page, which has its own.
Html SearchField() {
  Html html;
  html << R"(<form class="find" role="search" action="/search"><label class="unseen" for="find">)"
       << "Search photos"
       << R"(</label><input id="find" type="search" name="words" maxlength="1000" )"
       << R"(placeholder="Search photos" autocomplete="off" enterkeyhint="search">)"
       << R"(<button type="submit" aria-label="Search">)" << Icon("search") << "</button></form>";
  return html;
}

/// A whole document. `title` is a text, `main` the content of the main element.
std::string Document(const Site& site, Section section, const std::string& title,
                     const Html& main) {
  Html html;
  html
      << "<!doctype html>\n"
         "<html lang=\"en\">\n"
         "<head>\n"
         "<meta charset=\"utf-8\">\n"
         "<meta name=\"viewport\" content=\"width=device-width, initial-scale=1\">\n"
         "<meta name=\"color-scheme\" content=\"light dark\">\n"
         "<title>"
      << title
      << "</title>\n"
         "<link rel=\"icon\" href=\"/icon.svg\" type=\"image/svg+xml\">\n"
         "<link rel=\"stylesheet\" href=\"/style.css\">\n"
         "<script src=\"/script.js\" type=\"module\"></script>\n"
         "</head>\n"
         "<body>\n"
         "<a class=\"skip\" href=\"#main\">Skip to the content</a>\n"
         "<header class=\"top\">\n"
         "<a class=\"brand\" href=\"/\"><img src=\"/icon.svg\" alt=\"\" width=\"28\" height=\"28\">"
         "<span>zophotos</span></a>\n"
         "<nav aria-label=\"Views\"><ul>"
      << Link(Section::Photos, section, "/", "Photos")
      << Link(Section::Folders, section, "/folders", "Folders")
      << Link(Section::Volumes, section, "/volumes", "Volumes")
      << Link(Section::Search, section, "/search", "Search") << "</ul></nav>\n";
  if (section != Section::Search) {
    html << SearchField() << "\n";
  }
  html << "</header>\n"
          "<div id=\"notice\" class=\"notice\" role=\"status\" data-state=\""
       << std::string(NameOf(site.snapshot.state)) << "\">" << Notice(site.snapshot)
       << "</div>\n"
          "<main id=\"main\" tabindex=\"-1\">\n"
       << main
       << "</main>\n"
          "</body>\n"
          "</html>\n";
  return html.Text();
}

/// A photo in a grid. The script fills a copy of an empty one.
Html Tile(const Photo& photo, const Selection& selection) {
  Html html;
  html << "<li data-id=\"" << photo.id << "\"><a href=\"" << PhotoAddress(photo.id, selection)
       << "\"><img src=\"/photos/" << photo.id << "/rendition\" alt=\"" << NameText(photo.name)
       << R"(" loading="lazy" decoding="async" width="256" height="256">)"
       << R"(<span class="caption" aria-hidden="true">)" << Name(photo.name) << "</span></a></li>";
  return html;
}

/// Opens a month's part of a grid.
Html MonthStart(const std::string& key) {
  Html html;
  html << R"(<section class="month" data-month=")" << key << "\"><h2>" << MonthTitle(key)
       << "</h2><ol class=\"grid\">\n";
  return html;
}

constexpr const char MONTH_END[] = "</ol></section>\n";

/// One photo with its facts, for its own page and for the dialog of the lists.
Html Viewer(const PhotoView& view) {
  const Photo& photo = view.photo;
  const auto step = [&](const std::optional<PhotoId>& id, const char* direction,
                        const char* label) {
    Html html;
    html << R"(<a class="step )" << std::string(direction) << R"(" aria-label=")"
         << std::string(label) << "\"";
    if (id) {
      html << " href=\"" << PhotoAddress(*id, view.selection) << "\"";
    } else {
      html << " hidden";
    }
    html << ">" << Icon(direction) << "</a>";
    return html;
  };
  const std::string folder = photo.path.substr(0, photo.path.rfind('/') + 1);
  const std::string iso = zophotos::IsoTime(photo.modified).value_or("");
  Html html;
  html << R"(<article class="viewer" aria-labelledby="photo-name"><div class="stage">)"
       << step(view.newer, "newer", "Newer photo") << R"(<img class="large" alt=")"
       << NameText(photo.name) << "\"";
  if (!photo.path.empty()) {
    html << " src=\"/photos/" << photo.id << "/rendition\"";
  }
  html << R"(><p class="missing" hidden>This photo cannot be shown at the moment.</p>)"
       << step(view.older, "older", "Older photo") << R"(</div><div class="facts">)"
       << R"(<h1 id="photo-name" aria-live="polite">)" << Name(photo.name)
       << R"(</h1><dl><div><dt>Time</dt><dd><time)";
  if (!iso.empty()) {
    html << " datetime=\"" << iso << "\"";
  }
  html << ">" << (photo.path.empty() ? "" : zophotos::LocalTime(photo.modified))
       << R"(</time></dd></div><div><dt>Volume</dt><dd><a class="volume-link" href=")"
       << VolumeAddress(photo.volume) << "\">" << Name(photo.volume)
       << R"(</a></dd></div><div><dt>Folder</dt><dd><a class="folder-link" href="/folders/)"
       << photo.folder << "\">" << Name(folder)
       << R"(</a></dd></div></dl><p class="actions"><a class="button original" href="/photos/)"
       << photo.id << R"(/original" download>)" << Icon("download")
       << R"(Download the original</a> <a class="button close" href=")"
       << ListAddress(view.selection) << "\">" << Icon("close")
       << R"(Close</a></p></div></article>)";
  return html;
}

/// A list of photos in a grid. `path` is the address of the view without the list's parameters.
Html Photos(const PhotoList& list, const std::string& path, const Selection& selection) {
  Html html;
  html << R"(<div class="photos" data-query=")" << Address("", selection) << "\"";
  if (list.hasNewer) {
    html << " data-newer";
  }
  if (list.hasOlder) {
    html << " data-older";
  }
  html << ">\n";
  std::optional<std::string> month;
  for (const Photo& photo : list.photos) {
    if (const std::string key = MonthKey(photo.modified); month != key) {
      if (month) {
        html << MONTH_END;
      }
      html << MonthStart(key);
      month = key;
    }
    html << Tile(photo, selection) << "\n";
  }
  if (month) {
    html << MONTH_END;
  }
  html << "</div>\n<nav class=\"more\" aria-label=\"More photos\">";
  if (list.hasNewer && !list.photos.empty()) {
    html << R"(<a class="button newest" href=")" << path << R"(">Newest photos</a> )"
         << R"(<a class="button newer" rel="prev" href=")"
         << WithParameter(path, "after", std::to_string(list.photos.front().id))
         << R"(">Newer photos</a> )";
  }
  if (list.hasOlder && !list.photos.empty()) {
    html << R"(<a class="button older" rel="next" href=")"
         << WithParameter(path, "before", std::to_string(list.photos.back().id))
         << R"(">Older photos</a>)";
  }
  html << "</nav>\n<template id=\"tile\">" << Tile({}, {}) << "</template>\n"
       << "<template id=\"viewer\">" << Viewer({}) << "</template>\n";
  return html;
}

/// The progress of a volume's photos.
Html Progress(const Volume& volume) {
  const std::int64_t total = std::max<std::int64_t>(volume.total, 0);
  Html html;
  html << R"(<progress aria-label="Transcoded photos" max=")" << std::max<std::int64_t>(total, 1)
       << "\" value=\"" << std::clamp<std::int64_t>(volume.transcoded, 0, total)
       << "\"></progress>";
  return html;
}

/// "50 %"; rounded down, so that only all photos are 100 %.
std::string Percent(const Volume& volume) {
  if (volume.isGone) {
    return "gone";
  }
  if (volume.total <= 0) {
    return "";
  }
  const auto done =
      static_cast<double>(std::clamp<std::int64_t>(volume.transcoded, 0, volume.total));
  return std::to_string(static_cast<int>(done * 100 / static_cast<double>(volume.total))) + " %";
}

/// Opens the list item of a volume.
Html VolumeStart(const Volume& volume) {
  Html html;
  html << "<li class=\"volume";
  if (volume.isGone) {
    html << " gone";
  }
  // The script has the name from JSON, in UTF-8.
  html << "\" data-volume=\"" << NameText(zophotos::ToUtf8(volume.mountPoint)) << "\">";
  return html;
}

/// The volumes in short, above the newest photos.
Html Strip(const std::vector<Volume>& volumes) {
  const auto item = [](const Volume& volume) {
    Html html;
    html << VolumeStart(volume) << R"(<a class="volume-link" href=")"
         << VolumeAddress(volume.mountPoint) << R"("><span class="name">)"
         << Name(LastComponent(volume.mountPoint)) << R"(</span> <span class="percent">)"
         << Percent(volume) << "</span>" << Progress(volume) << "</a></li>";
    return html;
  };
  Html html;
  html << R"(<nav class="strip" aria-label="Volumes")";
  if (volumes.empty()) {
    html << " hidden";
  }
  html << "><ul>";
  for (std::size_t i = 0; i < std::min(volumes.size(), MOST_IN_STRIP); ++i) {
    html << item(volumes[i]);
  }
  if (volumes.size() > MOST_IN_STRIP) {
    html << "<li><a href=\"/volumes\">All " << Grouped(static_cast<std::int64_t>(volumes.size()))
         << " volumes</a></li>";
  }
  html << "</ul></nav>\n<template id=\"volume\">" << item({}) << "</template>\n";
  return html;
}

/// What to do when there are no photos.
Html Empty(const Site& site) {
  Html html;
  const bool isPreparing = std::ranges::any_of(site.volumes, [](const Volume& volume) {
    return !volume.isGone && (volume.total > 0 || volume.waiting.value_or(0) > 0);
  });
  html << R"(<section class="empty" id="empty" data-kind=")";
  if (site.snapshot.state == SnapshotStatus::State::Building) {
    html << "building\"><h2>One moment</h2><p>The photos appear here as soon as their list is "
            "built.</p>";
  } else if (isPreparing) {
    html
        << "preparing\"><h2>The photos are being prepared</h2><p>A photo appears here when its rendition, a "
           "small copy of it, is made. <a href=\"/volumes\">See how far the volumes are</a>.</p>";
  } else {
    html
        << "none\"><h2>No photos yet</h2><ul>"
           "<li>Copy photos to <code>/shares/Photos</code>, or</li>"
           "<li>plug in a disk with photos. It has to be mounted directly below "
           "<code>/shares</code>.</li></ul>"
           "<p>A photo appears here some seconds later, when its rendition, a small copy of it, is "
           "made. If none appears, the command <code>zophotos status</code> tells what the "
           "services are doing.</p>";
  }
  html << "</section>\n";
  return html;
}

Html Option(const std::string& value, const std::string& text, bool isSelected) {
  Html html;
  html << "<option value=\"" << value << "\"";
  if (isSelected) {
    html << " selected";
  }
  html << ">" << text << "</option>";
  return html;
}

Html SearchForm(const Site& site, const Selection& selection, const std::vector<Month>& months) {
  Html html;
  html << R"(<form class="search" role="search" action="/search"><p class="field words">)"
       << R"(<label for="words">Words in the path</label><input id="words" type="search" )"
       << R"(name="words" maxlength="1000" autocomplete="off" enterkeyhint="search" value=")"
       << selection.words << R"("></p><p class="field"><label for="volume-field">Volume</label>)"
       << R"(<select id="volume-field" name="volume">)"
       << Option("", "All volumes", !selection.volume);
  bool isListed = !selection.volume;
  for (const Volume& volume : site.volumes) {
    // A form can send only UTF-8.
    if (volume.isMerged && zophotos::ToUtf8(volume.mountPoint) == volume.mountPoint) {
      html << Option(volume.mountPoint, NameText(volume.mountPoint),
                     selection.volume == volume.mountPoint);
      isListed = isListed || selection.volume == volume.mountPoint;
    }
  }
  if (!isListed) {
    html << Option(*selection.volume, NameText(*selection.volume), true);
  }
  html
      << R"(</select></p><p class="field"><label for="month">Time</label><select id="month" name="month">)"
      << Option("", "All times", !selection.year);
  const std::string chosen = MonthText(selection);
  isListed = chosen.empty();
  const auto option = [&](const Selection& time, const std::string& text) {
    const std::string value = MonthText(time);
    html << Option(value, text, value == chosen);
    isListed = isListed || value == chosen;
  };
  std::optional<int> year;
  for (const Month& month : months) {
    Selection time;
    time.year = month.year;
    if (year != month.year) {
      option(time, MonthText(time));
      year = month.year;
    }
    time.month = std::clamp(month.month, 1, 12);
    option(time, MonthTitle(MonthText(time)));
  }
  if (!isListed) {
    html << Option(chosen, selection.month ? MonthTitle(chosen) : chosen, true);
  }
  html << R"(</select></p><p class="field"><button type="submit" class="button">)" << Icon("search")
       << "Search</button></p></form>\n";
  return html;
}

/// The months that have photos, as links.
Html Calendar(const std::vector<Month>& months) {
  Html html;
  std::optional<int> year;
  html << R"(<section class="calendar" aria-label="Months with photos">)";
  for (const Month& month : months) {
    Selection time;
    time.year = month.year;
    if (year != month.year) {
      if (year) {
        html << "</ul>";
      }
      html << "<h2><a href=\"" << Address("/search", time) << "\">" << month.year
           << "</a></h2><ul>";
      year = month.year;
    }
    time.month = std::clamp(month.month, 1, 12);
    html << "<li><a href=\"" << Address("/search", time) << "\">"
         << std::string(MONTHS.at(static_cast<std::size_t>(*time.month) - 1)) << "</a></li>";
  }
  if (year) {
    html << "</ul>";
  }
  html << "</section>\n";
  return html;
}

Html FolderItem(const Folder& folder) {
  Html html;
  html << "<li data-id=\"" << folder.id << "\"";
  if (folder.hasFolders) {
    html << " data-folders";
  }
  html << "><a href=\"/folders/" << folder.id << "\">" << Icon("folder")
       << Name(LastComponent(folder.path)) << "</a></li>\n";
  return html;
}

Html Crumbs(const FolderView& view) {
  Html html;
  html
      << "<nav class=\"crumbs\" aria-label=\"Folders above\"><ol><li><a href=\"/folders\">Folders</a>"
         "</li>";
  for (const Folder& folder : view.ancestors) {
    // The folder that contains the volumes is the top itself.
    if (folder.parent != -1 || folder.path != "/shares/") {
      html << "<li><a href=\"/folders/" << folder.id << "\">" << Name(LastComponent(folder.path))
           << "</a></li>";
    }
  }
  html << "</ol></nav>\n";
  return html;
}

Html VolumeCard(const Volume& volume) {
  const auto number = [](const char* name, const std::optional<std::int64_t>& value,
                         const char* text) {
    Html html;
    html << "<span class=\"" << std::string(name) << "\"";
    if (value.value_or(0) <= 0) {
      html << " hidden";
    }
    html << "><b>" << Grouped(value.value_or(0)) << "</b> " << std::string(text) << "</span>";
    return html;
  };
  Html html;
  html << VolumeStart(volume) << "<h2>" << Icon("disk") << R"(<a class="volume-link" href=")"
       << VolumeAddress(volume.mountPoint) << R"("><span class="name">)"
       << Name(LastComponent(volume.mountPoint)) << "</span></a> <span class=\"percent\">"
       << Percent(volume) << R"(</span></h2><p class="place">)" << Name(volume.mountPoint) << "</p>"
       << Progress(volume) << R"(<p class="counts"><b class="transcoded">)"
       << Grouped(volume.transcoded) << R"(</b> of <b class="total">)" << Grouped(volume.total)
       << R"(</b> photos transcoded</p><p class="rest">)"
       << number("waiting", volume.waiting, "waiting") << " "
       << number("failed", volume.failed, "failed") << R"(</p><p class="activity">)"
       << NameText(volume.activity) << R"(</p><p class="merged"><span>Merged up to</span> <b>)"
       << (volume.mergedUpTo == 0 ? "-" : zophotos::LocalTime(volume.mergedUpTo))
       << R"(</b></p><p class="absent">Not plugged in. Its photos are back when it is.</p></li>)"
       << "\n";
  return html;
}

} // namespace

std::string NewestPage(const Site& site, const PhotoList& list) {
  Html main;
  main << "<h1 class=\"unseen\">Newest photos</h1>\n" << Strip(site.volumes);
  if (list.photos.empty()) {
    main << Empty(site);
  }
  main << Photos(list, "/", {});
  return Document(site, Section::Photos, "Photos", main);
}

std::string SearchPage(const Site& site, const Selection& selection,
                       const std::vector<Month>& months, const PhotoList& list) {
  Html main;
  main << "<h1>Search</h1>\n" << SearchForm(site, selection, months);
  if (selection == Selection()) {
    main << (months.empty() ? Empty(site) : Calendar(months));
  } else {
    if (list.photos.empty()) {
      main
          << "<p class=\"nothing\">No photo matches. Each word must be the beginning of a word in the path of a photo. A word has only letters or only digits.</p>\n";
    }
    main << Photos(list, Address("/search", selection), selection);
  }
  return Document(site, Section::Search, "Search", main);
}

std::string FolderPage(const Site& site, const FolderView& view) {
  Html main;
  Selection selection;
  std::string address = "/folders";
  std::string title = "Folders";
  if (view.folder) {
    selection.folder = view.folder->id;
    address = ListAddress(selection);
    title = NameText(LastComponent(view.folder->path));
    main << Crumbs(view) << "<h1>" << Name(LastComponent(view.folder->path)) << "</h1>\n";
  } else {
    main << "<h1>Folders</h1>\n";
  }
  main << "<div class=\"folder\">\n";
  if (!view.folders.empty()) {
    main << "<nav class=\"tree\" aria-label=\"Folders\"><ul>\n";
    for (const Folder& folder : view.folders) {
      main << FolderItem(folder);
    }
    main << "</ul>";
    if (view.hasMoreFolders) {
      main << R"(<p><a class="button" href=")"
           << WithParameter(address, "after_folder", std::to_string(view.folders.back().id))
           << R"(">More folders</a></p>)";
    }
    main << "</nav>\n<template id=\"folder\">" << FolderItem({}) << "</template>\n";
  } else if (!view.folder) {
    main << Empty(site);
  }
  if (view.folder) {
    main << "<div class=\"content\">\n";
    if (view.list.photos.empty()) {
      main << "<p class=\"nothing\">There are no photos directly in this folder.</p>\n";
    }
    main << Photos(view.list, address, selection) << "</div>\n";
  }
  main << "</div>\n";
  return Document(site, Section::Folders, title, main);
}

std::string PhotoPage(const Site& site, const PhotoView& view) {
  Html main;
  main << Viewer(view);
  return Document(site, Section::None, NameText(view.photo.name), main);
}

std::string VolumesPage(const Site& site) {
  Html main;
  main << "<h1>Volumes</h1>\n";
  if (site.volumes.empty()) {
    main << Empty(site);
  }
  main << "<ul class=\"volumes\">\n";
  for (const Volume& volume : site.volumes) {
    main << VolumeCard(volume);
  }
  main << "</ul>\n<template id=\"volume\">" << VolumeCard({}) << "</template>\n";
  if (site.mayHaveMoreVolumes) {
    main << "<p>There may be more volumes: this page shows the first "
         << Grouped(static_cast<std::int64_t>(site.volumes.size())) << ".</p>\n";
  }
  return Document(site, Section::Volumes, "Volumes", main);
}

std::string ErrorPage(int status, const std::string& text) {
  Html main;
  main << "<section class=\"empty\"><h1>" << NameText(text) << "</h1><p>Error " << status
       << R"(. <a href="/">All photos</a></p></section>)"
       << "\n";
  Site site;
  site.snapshot.state = SnapshotStatus::State::Current;
  return Document(site, Section::None, NameText(text), main);
}

} // namespace orva::web
