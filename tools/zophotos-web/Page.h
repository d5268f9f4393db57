#pragma once

#include "zophotos-web/Selection.h"
#include "zophotos-web/Snapshot.h"
#include "zophotos-web/SnapshotReader.h"
#include "zophotos-web/Volume.h"

#include <optional>
#include <string>
#include <vector>

/// The HTML of all views. Each function returns a whole document in UTF-8 that works without
/// scripts. The texts in the arguments are untrusted bytes: the functions escape them.
namespace orva::web {

/// What every view shows.
struct Site {
  SnapshotStatus snapshot;
  std::vector<Volume> volumes;
  bool mayHaveMoreVolumes = false; ///< these are the first ones
};

/// A part of a list of photos, newest first.
struct PhotoList {
  std::vector<Photo> photos;
  bool hasNewer = false; ///< the list has photos before the first: "?after=ID" shows them
  bool hasOlder = false; ///< the list has photos after the last: "?before=ID" shows them
};

/// "/": the newest photos of all volumes.
std::string NewestPage(const Site& site, const PhotoList& list);

/// "/search": the form, and what it found. `months` are the months that have photos, newest first.
std::string SearchPage(const Site& site, const Selection& selection,
                       const std::vector<Month>& months, const PhotoList& list);

/// A folder and what is in it.
struct FolderView {
  std::optional<Folder> folder;  ///< nothing for the top of the tree
  std::vector<Folder> ancestors; ///< from the top, without the folder itself
  std::vector<Folder> folders;   ///< directly in it, by path
  bool hasMoreFolders = false;   ///< "?after_folder=ID" goes on after the last one
  PhotoList list;                ///< the photos directly in it
};

/// "/folders" and "/folders/ID".
std::string FolderPage(const Site& site, const FolderView& view);

/// One photo.
struct PhotoView {
  Photo photo;
  Selection selection;          ///< the list that it was opened from
  std::optional<PhotoId> newer; ///< its neighbours in that list
  std::optional<PhotoId> older;
};

/// "/photos/ID": a photo, large.
std::string PhotoPage(const Site& site, const PhotoView& view);

/// "/volumes".
std::string VolumesPage(const Site& site);

/// The page of an answer that is an error. `text` is a sentence for people: "There is no such
/// photo."
std::string ErrorPage(int status, const std::string& text);

} // namespace orva::web
