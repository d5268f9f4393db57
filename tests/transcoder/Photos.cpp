#include "transcoder/Photos.h"

#include "support/Program.h"

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <stdexcept>

namespace orva::test {
namespace {

/// A file for steps in between.
std::string Scratch(const std::string& name) {
  std::filesystem::create_directories("/tmp/scratch");
  return "/tmp/scratch/" + name;
}

void Append(std::string& bytes, std::uint32_t number, int count) {
  for (int i = 0; i < count; ++i) {
    bytes += static_cast<char>(number >> (8 * i) & 0xFF);
  }
}

} // namespace

std::string RunChecked(const std::vector<std::string>& arguments) {
  const Outcome outcome = Run(arguments);
  if (outcome.status != 0) {
    throw std::runtime_error(arguments.front() + ' ' + arguments.at(1) + ": " + outcome.error);
  }
  return outcome.output;
}

void MakePhoto(const std::string& path, int width, int height, const std::string& options) {
  const std::string w = std::to_string(width);
  const std::string h = std::to_string(height);
  RunChecked({"vips", "identity", Scratch("row.v")});
  RunChecked({"vips", "resize", Scratch("row.v"), Scratch("wide.v"), std::to_string(width / 256.0),
              "--vscale", h});
  RunChecked({"vips", "bandjoin",
              Scratch("wide.v") + ' ' + Scratch("wide.v") + ' ' + Scratch("wide.v"),
              Scratch("three.v")});
  RunChecked({"vips", "linear", Scratch("three.v"), Scratch("colour.v"), "0.8 0.5 0.2", "10 60 90",
              "--uchar"});
  RunChecked({"vips", "copy", Scratch("colour.v"), path + options, "--interpretation", "srgb"});
}

void MakeSlowPhoto(const std::string& path) {
  RunChecked(
      {"vips", "black", path + "[interlace,compression=1]", "14000", "14000", "--bands", "3"});
}

void MakeQuarters(const std::string& path, int orientation) {
  const auto patch = [](const std::string& name, const std::string& colour) {
    RunChecked({"vips", "black", Scratch("black.v"), "60", "40", "--bands", "3"});
    RunChecked({"vips", "linear", Scratch("black.v"), Scratch(name), "1 1 1", colour, "--uchar"});
    return Scratch(name) + ' ';
  };
  const std::string patches = patch("red.v", "250 0 0") + patch("green.v", "0 250 0") +
                              patch("blue.v", "0 0 250") + patch("yellow.v", "250 250 0");
  RunChecked({"vips", "arrayjoin", patches, Scratch("quarters.v"), "--across", "2"});
  RunChecked({"vips", "copy", Scratch("quarters.v"), path + "[Q=95]", "--interpretation", "srgb"});
  RunChecked({"exiv2", "-M", "set Exif.Image.Orientation " + std::to_string(orientation), path});
}

char QuarterOf(const std::string& path, int x, int y) {
  const auto [red, green, blue] = PixelOf(path, x, y);
  if (blue > 128) {
    return 'B';
  }
  return red > 128 ? (green > 128 ? 'Y' : 'R') : 'G';
}

ImageHeader HeaderOf(const std::string& path) {
  // "path: 1024x683 uchar, 3 bands, srgb, jpegload"
  std::istringstream line(RunChecked({"vipsheader", path}).substr(path.size() + 2));
  ImageHeader header;
  char by = 0;
  line >> header.width >> by >> header.height >> std::ws;
  std::getline(line, header.rest);
  return header;
}

void DecodeAll(const std::string& path) {
  RunChecked({"vips", "avg", path + "[fail-on=warning]"});
}

std::array<int, 3> PixelOf(const std::string& path, int x, int y) {
  std::istringstream values(
      RunChecked({"vips", "getpoint", path, std::to_string(x), std::to_string(y)}));
  std::array<int, 3> pixel{};
  values >> pixel[0] >> pixel[1] >> pixel[2];
  return pixel;
}

std::string ReadBytes(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

void WriteBytes(const std::string& path, const std::string& bytes) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << bytes;
}

std::string RawFile(const std::string& preview, int orientation) {
  struct Entry {
    std::uint32_t tag;
    std::uint32_t type;
    std::uint32_t value;
  };
  constexpr std::uint32_t SHORT = 3;
  constexpr std::uint32_t LONG = 4;
  std::vector<Entry> entries = {{0x100, LONG, 160},
                                {0x101, LONG, 120},
                                {0x112, SHORT, static_cast<std::uint32_t>(orientation)}};
  if (!preview.empty()) {
    const auto offset = static_cast<std::uint32_t>(8 + 2 + (entries.size() + 2) * 12 + 4);
    entries.push_back({0x201, LONG, offset});
    entries.push_back({0x202, LONG, static_cast<std::uint32_t>(preview.size())});
  }
  std::string bytes("II*\0\x08\0\0\0", 8);
  Append(bytes, static_cast<std::uint32_t>(entries.size()), 2);
  for (const Entry& entry : entries) {
    Append(bytes, entry.tag, 2);
    Append(bytes, entry.type, 2);
    Append(bytes, 1, 4);
    Append(bytes, entry.value, 4);
  }
  Append(bytes, 0, 4);
  return bytes + preview;
}

std::string WithoutMetadata(const std::string& path) {
  const std::string copy = Scratch("stripped.jpg");
  std::filesystem::copy_file(path, copy, std::filesystem::copy_options::overwrite_existing);
  RunChecked({"exiv2", "rm", copy});
  return ReadBytes(copy);
}

} // namespace orva::test
