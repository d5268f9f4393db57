#pragma once

#include <string>
#include <string_view>

// What a catalog derives from the name of a file or folder. Names are byte strings; the case of
// ASCII letters does not matter.
namespace orva::catalog {

/// Folders.category and Files.category.
enum Category : int { OTHER = 0, MUSIC = 1, VIDEO = 2, PHOTO = 3, FOLDER = 4 };

/// The flags of a catalog row.
struct Flags {
  bool isBackup = false;
  bool isHidden = false;
  bool isSystem = false;

  bool operator==(const Flags&) const = default;
};

/// The flags of a file or folder called `name` in a folder with the flags `folder`, which it
/// inherits.
Flags FlagsOf(std::string_view name, const Flags& folder);

/// The extension in lower case, without its dot. A backup has the extension of its original.
std::string ExtensionOf(std::string_view name);

/// The category of files with this extension (as ExtensionOf gives it).
Category CategoryOf(std::string_view extension);

} // namespace orva::catalog
