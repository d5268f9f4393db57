#include "Templates.h"

#include "support/Program.h"
#include "transcoder/Photos.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

namespace orva::test {
namespace {

/// Where the quarters of MakeQuarters are in the upright photo, clockwise, for each orientation.
const std::vector<std::string> UPRIGHT = {"RGYB", "GRBY", "YBRG", "BYGR",
                                          "RBYG", "BRGY", "YGRB", "GYBR"};

/// A PNG that claims 60,000 x 60,000 pixels.
const std::string BOMB("\x89PNG\r\n\x1a\n\0\0\0\x0dIHDR\0\0\xea\x60\0\0\xea\x60\x08\x02\0\0\0"
                       "\x0f\xb0\xe2\x15\0\0\0\x01IDAT\x78\x76\xe6\x84\xe6\0\0\0\0IEND\xae"
                       "\x42\x60\x82",
                       58);

/// A colour of MakeQuarters: 'R', 'G', 'B' or 'Y'.
char ColourAt(const std::string& path, int x, int y) {
  std::istringstream pixel(
      RunChecked({"vips", "getpoint", path, std::to_string(x), std::to_string(y)}));
  int red = 0;
  int green = 0;
  int blue = 0;
  pixel >> red >> green >> blue;
  if (blue > 128) {
    return 'B';
  }
  return red > 128 ? (green > 128 ? 'Y' : 'R') : 'G';
}

void MakePhotos(const std::string& place) {
  std::filesystem::create_directories(place);
  MakeQuarters(place + "/1.jpg", 1);
  for (int orientation = 2; orientation <= 8; ++orientation) {
    const std::string path = place + "/" + std::to_string(orientation) + ".jpg";
    std::filesystem::copy_file(place + "/1.jpg", path);
    RunChecked({"exiv2", "-M", "set Exif.Image.Orientation " + std::to_string(orientation), path});
    // Each has another size.
    std::ofstream(path, std::ios::app) << std::string(static_cast<std::size_t>(orientation), ' ');
  }
  MakePhoto(place + "/large.jpg", 1500, 1000);
  RunChecked({"exiv2", "-M", "set Exif.Image.Orientation 6", place + "/large.jpg"});
  MakePhoto(place + "/wide.png", 1300, 900);
  MakePhoto(place + "/a.webp", 700, 500);
  MakePhoto(place + "/a.tif", 300, 200);
  MakePhoto(place + "/a.gif", 90, 60);
  MakePhoto(place + "/secret.png", 111, 77);
}

} // namespace

Templates::Templates(const std::string& place) {
  if (!std::filesystem::exists(place)) {
    MakePhotos(place);
  }
  for (int orientation = 1; orientation <= 8; ++orientation) {
    const bool isTurned = orientation > 4;
    Add(place + "/" + std::to_string(orientation) + ".jpg", isTurned ? 80 : 120,
        isTurned ? 120 : 80, UPRIGHT.at(static_cast<std::size_t>(orientation - 1)));
  }
  Add(place + "/large.jpg", 683, 1024);
  Add(place + "/wide.png", 1024, 709);
  Add(place + "/a.webp", 700, 500);
  Add(place + "/a.tif", 300, 200);
  Add(place + "/a.gif", 90, 60);

  AddBytes("no image");
  AddBytes("<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"9\" height=\"9\"/>");
  AddBytes(BOMB);
  AddBytes(Bytes(8).substr(0, 40));                             // cut
  AddBytes(Bytes(9).substr(0, 60) + std::string(5000, '\x5a')); // malformed
  AddBytes("\xff\xd8\xff\xe0" + std::string(30000, '\xff'));    // a JPEG without an image
  AddBytes("");

  secret_ = Count();
  Add(place + "/secret.png", 111, 77);
}

void Templates::Add(const std::string& path, int width, int height, const std::string& corners) {
  AddBytes(ReadBytes(path));
  templates_.back().width = width;
  templates_.back().height = height;
  templates_.back().corners = corners;
}

void Templates::AddBytes(const std::string& bytes) {
  // A catalog tells contents apart by their sizes and times.
  if (std::ranges::any_of(templates_, [&bytes](const Template& other) {
        return other.bytes.size() == bytes.size();
      })) {
    throw std::runtime_error("two templates have the same size");
  }
  templates_.push_back({.bytes = bytes});
}

std::string Templates::Examine(std::size_t index, const std::string& rendition) {
  Template& photo = templates_.at(index);
  std::string bytes = ReadBytes(rendition);
  if (photo.renditions.contains(bytes)) {
    return "";
  }
  std::string problem;
  try {
    problem = LookAt(photo, rendition);
  } catch (const std::runtime_error& error) {
    problem = error.what();
  }
  if (problem.empty()) {
    photo.renditions.insert(std::move(bytes));
  }
  return problem;
}

std::string Templates::LookAt(const Template& photo, const std::string& path) {
  const ImageHeader header = HeaderOf(path);
  if (header.width != photo.width || header.height != photo.height ||
      !header.rest.ends_with("jpegload")) {
    return "it has " + std::to_string(header.width) + " x " + std::to_string(header.height) +
           " pixels, " + header.rest;
  }
  DecodeAll(path);
  if (!Run({"exiv2", "-q", "-PE", path}).output.empty()) {
    return "it has metadata";
  }
  if (!photo.corners.empty()) {
    const int right = photo.width - 10;
    const int bottom = photo.height - 10;
    const std::string corners = {ColourAt(path, 10, 10), ColourAt(path, right, 10),
                                 ColourAt(path, right, bottom), ColourAt(path, 10, bottom)};
    if (corners != photo.corners) {
      return "its corners are " + corners + ", not " + photo.corners;
    }
  }
  return "";
}

} // namespace orva::test
