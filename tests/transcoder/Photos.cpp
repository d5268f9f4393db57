#include "transcoder/Photos.h"

#include "support/Program.h"

#include <algorithm>
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

char Sample(double value) {
  return static_cast<char>(static_cast<unsigned char>(value));
}

/// Has libvips write an image of three bands; `pixels` are row by row.
void MakeImage(const std::string& output, int width, int height, const std::string& pixels) {
  const std::string bitmap = Scratch("pixels.ppm");
  std::ofstream(bitmap, std::ios::binary) << "P6\n"
                                          << width << ' ' << height << "\n255\n"
                                          << pixels;
  RunChecked({"vips", "copy", bitmap, output});
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
  std::string row;
  for (int x = 0; x < width; ++x) {
    const double shade = 255.0 * x / std::max(width - 1, 1);
    row += {Sample(0.8 * shade + 10), Sample(0.5 * shade + 60), Sample(0.2 * shade + 90)};
  }
  std::string pixels;
  pixels.reserve(row.size() * static_cast<std::size_t>(height));
  for (int y = 0; y < height; ++y) {
    pixels += row;
  }
  MakeImage(path + options, width, height, pixels);
}

void MakeSlowPhoto(const std::string& path) {
  RunChecked(
      {"vips", "black", path + "[interlace,compression=1]", "14000", "14000", "--bands", "3"});
}

void MakeQuarters(const std::string& path, int orientation) {
  const auto row = [](const std::string& left, const std::string& right) {
    std::string pixels;
    for (int x = 0; x < 120; ++x) {
      pixels += x < 60 ? left : right;
    }
    return pixels;
  };
  const std::string above = row({'\xFA', 0, 0}, {0, '\xFA', 0});
  const std::string below = row({0, 0, '\xFA'}, {'\xFA', '\xFA', 0});
  std::string pixels;
  for (int y = 0; y < 80; ++y) {
    pixels += y < 40 ? above : below;
  }
  MakeImage(path + "[Q=95]", 120, 80, pixels);
  RunChecked({"exiv2", "-M", "set Exif.Image.Orientation " + std::to_string(orientation), path});
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

Pixels::Pixels(const std::string& path) {
  const std::string bitmap = Scratch("decoded.ppm");
  RunChecked({"vips", "copy", path, bitmap});
  std::ifstream file(bitmap, std::ios::binary);
  std::string word;
  while (file >> word && word != "255") {
    if (word.starts_with('#')) {
      std::getline(file, word);
    } else {
      header_.push_back(word);
    }
  }
  file.get();
  samples_.assign(std::istreambuf_iterator<char>(file), {});
  if (header_.size() != 3 || header_.front() != "P6") {
    throw std::runtime_error(path + " has not three bands");
  }
}

std::array<int, 3> Pixels::At(int x, int y) const {
  const int offset = 3 * (y * std::stoi(header_.at(1)) + x);
  std::array<int, 3> pixel{};
  for (std::size_t band = 0; band < pixel.size(); ++band) {
    pixel.at(band) =
        static_cast<unsigned char>(samples_.at(static_cast<std::size_t>(offset) + band));
  }
  return pixel;
}

char Pixels::QuarterAt(int x, int y) const {
  const auto [red, green, blue] = At(x, y);
  if (blue > 128) {
    return 'B';
  }
  return red > 128 ? (green > 128 ? 'Y' : 'R') : 'G';
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
