#pragma once

#include <array>
#include <string>
#include <vector>

// Photos are made on the spot, with the programs of libvips-tools and exiv2.
namespace orva::test {

/// Runs a program. Returns its output; throws std::runtime_error when it fails.
std::string RunChecked(const std::vector<std::string>& arguments);

/// Makes an image of three bands with a gradient. The name's extension tells the format; `options`
/// are those of libvips for the format: "[interlace]".
void MakePhoto(const std::string& path, int width, int height, const std::string& options = "");

/// Makes a PNG that takes seconds to render and little time to make.
void MakeSlowPhoto(const std::string& path);

/// Makes a JPEG with a colour in each quarter, and the EXIF orientation 1 to 8.
void MakeQuarters(const std::string& path, int orientation);

/// What libvips says of an image.
struct ImageHeader {
  int width = 0;
  int height = 0;
  std::string rest; ///< "uchar, 3 bands, srgb, jpegload"
};

/// Throws std::runtime_error when the image cannot be read.
ImageHeader HeaderOf(const std::string& path);

/// Decodes all of an image. Throws std::runtime_error when that fails.
void DecodeAll(const std::string& path);

/// The pixels of an image of three bands.
class Pixels {
public:
  /// Throws std::runtime_error when the image cannot be read.
  explicit Pixels(const std::string& path);

  /// The colour of a pixel.
  std::array<int, 3> At(int x, int y) const;
  /// A colour of MakeQuarters: 'R', 'G', 'B' or 'Y'.
  char QuarterAt(int x, int y) const;

private:
  std::vector<std::string> header_; ///< "P6", width, height
  std::string samples_;
};

std::string ReadBytes(const std::string& path);
void WriteBytes(const std::string& path, const std::string& bytes);

/// A raw file of a camera with `preview`, a JPEG, and an orientation; without one if it is empty.
std::string RawFile(const std::string& preview, int orientation);

/// A JPEG without its metadata.
std::string WithoutMetadata(const std::string& path);

} // namespace orva::test
