#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdlib>

namespace {

using namespace orva::test;
using testing::HasSubstr;
using testing::StartsWith;

using Formats = TranscoderTest;

TEST_F(Formats, EachFormatIsRenderedAsAJpegOfAtMost1024Pixels) {
  const Lines names = {"a.jpg", "b.jpeg", "c.png", "d.png", "e.png", "f.webp", "g.tiff", "h.tif",
                       "i.gif", "j.png",  "k.jpg", "l.jpg", "m.jpg", "n.heic", "o.heif", "p.jpe"};
  MakePhoto(At("a.jpg"), 1200, 900);
  MakePhoto(At("b.jpeg"), 900, 1200, "[interlace]");
  MakePhoto(At("c.png"), 1025, 40);
  MakePhoto(At("d.png"), 1200, 900, "[palette]");
  MakePhoto(At("e.png"), 1200, 900, "[interlace]");
  MakePhoto(At("f.webp"), 1200, 900);
  MakePhoto(At("g.tiff"), 1200, 900, "[compression=deflate,tile]");
  MakePhoto(At("h.tif"), 1200, 1800, "[page-height=900]"); // two pages
  MakePhoto(At("i.gif"), 1200, 1800, "[page-height=900]");
  // 16 bits for each channel
  RunChecked({"vips", "linear", At("a.jpg"), "/tmp/wide.v", "256", "0"});
  RunChecked({"vips", "cast", "/tmp/wide.v", "/tmp/ushort.v", "ushort"});
  RunChecked({"vips", "copy", "/tmp/ushort.v", At("j.png"), "--interpretation", "rgb16"});
  RunChecked({"vips", "colourspace", At("a.jpg"), At("k.jpg"), "b-w"});
  RunChecked(
      {"vips", "icc_transform", At("a.jpg"), At("l.jpg"), "cmyk", "--input-profile", "srgb"});
  // A profile other than sRGB
  RunChecked({"vips", "icc_transform", At("a.jpg"), At("m.jpg"), "p3", "--input-profile", "srgb"});
  MakePhoto(At("n.heic"), 1200, 900);
  MakePhoto(At("o.heic"), 900, 1200);
  std::filesystem::rename(At("o.heic"), At("o.heif"));
  MakePhoto(At("p.jpg"), 1200, 900);
  std::filesystem::rename(At("p.jpg"), At("p.jpe"));
  AddAllWaiting(names);
  RenderAll();

  for (const std::string& name : names) {
    SCOPED_TRACE(name);
    ASSERT_EQ(StateOf(name), "finished");
    const ImageHeader header = HeaderOf(Rendition(name));
    const bool isUpright = name == "b.jpeg" || name == "o.heif";
    EXPECT_EQ(std::max(header.width, header.height), 1024);
    EXPECT_EQ(std::min(header.width, header.height), name == "c.png" ? 40 : 768);
    EXPECT_EQ(header.height > header.width, isUpright);
    EXPECT_EQ(header.rest, "uchar, 3 bands, srgb, jpegload");
    DecodeAll(Rendition(name));
  }
  // The same colours as the original.
  const auto original = Pixels(Rendition("a.jpg")).At(1000, 700);
  for (const char* const name : {"f.webp", "g.tiff", "j.png", "l.jpg", "m.jpg", "n.heic"}) {
    const auto pixel = Pixels(Rendition(name)).At(1000, 700);
    for (std::size_t band = 0; band < 3; ++band) {
      // Printing inks show fewer colours.
      EXPECT_LE(std::abs(pixel.at(band) - original.at(band)), name[0] == 'l' ? 40 : 6)
          << name << ' ' << band;
    }
  }
}

TEST_F(Formats, EveryOrientationIsUpright) {
  // The colours of the quarters, from left to right and down, as they have to be seen.
  const std::array<std::string, 8> seen = {"RGBY", "GRYB", "YBGR", "BYRG",
                                           "RBGY", "BRYG", "YGBR", "GYRB"};
  Lines names;
  for (int orientation = 1; orientation <= 8; ++orientation) {
    names.push_back("o" + std::to_string(orientation) + ".jpg");
    MakeQuarters(At(names.back()), orientation);
  }
  AddAllWaiting(names);
  RenderAll();
  for (std::size_t i = 0; i < names.size(); ++i) {
    SCOPED_TRACE(names[i]);
    const std::string rendition = Rendition(names[i]);
    const ImageHeader header = HeaderOf(rendition);
    EXPECT_EQ(header.width, i < 4 ? 120 : 80);
    const int right = header.width - 10;
    const int bottom = header.height - 10;
    const Pixels pixels(rendition);
    EXPECT_EQ(std::string({pixels.QuarterAt(10, 10), pixels.QuarterAt(right, 10),
                           pixels.QuarterAt(10, bottom), pixels.QuarterAt(right, bottom)}),
              seen.at(i));
  }
}

TEST_F(Formats, SmallPhotosAreNotEnlarged) {
  MakePhoto(At("small.jpg"), 300, 200);
  MakePhoto(At("dot.png"), 1, 1);
  AddAllWaiting({"small.jpg", "dot.png"});
  RenderAll();
  EXPECT_EQ(HeaderOf(Rendition("small.jpg")).width, 300);
  EXPECT_EQ(HeaderOf(Rendition("small.jpg")).height, 200);
  EXPECT_EQ(HeaderOf(Rendition("dot.png")).width, 1);
}

TEST_F(Formats, TransparentPartsAreWhite) {
  RunChecked({"vips", "black", At("transparent.png"), "50", "50", "--bands", "4"});
  RunChecked({"vips", "copy", At("transparent.png"), "/tmp/t.v", "--interpretation", "srgb"});
  RunChecked({"vips", "copy", "/tmp/t.v", At("transparent.png")});
  AddWaiting("transparent.png");
  RenderAll();
  EXPECT_EQ(Pixels(Rendition("transparent.png")).At(25, 25), (std::array{255, 255, 255}));
}

TEST_F(Formats, RenditionsHaveNoMetadata) {
  MakePhoto(At("a.jpg"), 800, 600);
  RunChecked({"exiv2", "-M", "set Exif.GPSInfo.GPSLatitude 48/1 8/1 0/1", "-M",
              "set Exif.Image.Artist Alice", "-M", "set Xmp.dc.title Secret", At("a.jpg")});
  RunChecked({"vips", "icc_transform", At("a.jpg"), At("p3.jpg"), "p3", "--input-profile", "srgb"});
  AddAllWaiting({"a.jpg", "p3.jpg"});
  RenderAll();
  for (const char* const name : {"a.jpg", "p3.jpg"}) {
    const std::string bytes = ReadBytes(Rendition(name));
    for (const char* const part : {"Exif", "Alice", "Secret", "ICC_PROFILE"}) {
      EXPECT_EQ(bytes.find(part), std::string::npos) << name << ' ' << part;
    }
  }
}

TEST_F(Formats, AWrongExtensionDoesNotMatter) {
  MakePhoto(At("a.jpg"), 1500, 1000);
  std::filesystem::rename(At("a.jpg"), At("really-jpeg.png"));
  MakePhoto(At("b.png"), 1500, 1000);
  std::filesystem::rename(At("b.png"), At("really-png.nef"));
  AddAllWaiting({"really-jpeg.png", "really-png.nef"});
  RenderAll();
  EXPECT_EQ(HeaderOf(Rendition("really-jpeg.png")).width, 1024);
  EXPECT_EQ(HeaderOf(Rendition("really-png.nef")).width, 1024);
}

TEST_F(Formats, RawPhotosAreRenderedFromTheirPreview) {
  MakeQuarters("/tmp/preview.jpg", 1);
  MakeQuarters("/tmp/turned.jpg", 3);
  WriteBytes(At("own.nef"), RawFile(ReadBytes("/tmp/turned.jpg"), 6));
  WriteBytes(At("raw.DNG"), RawFile(WithoutMetadata("/tmp/preview.jpg"), 6));
  WriteBytes(At("none.cr2"), RawFile("", 1));
  AddAllWaiting({"own.nef", "raw.DNG", "none.cr2"});
  RenderAll();
  // The preview's own orientation counts first, then that of the raw photo.
  EXPECT_EQ(HeaderOf(Rendition("own.nef")).width, 120);
  EXPECT_EQ(Pixels(Rendition("own.nef")).QuarterAt(10, 10), 'Y');
  EXPECT_EQ(HeaderOf(Rendition("raw.DNG")).width, 80);
  EXPECT_EQ(Pixels(Rendition("raw.DNG")).QuarterAt(10, 10), 'B');
  EXPECT_EQ(StateOf("none.cr2"), "failed: no preview in this raw photo");
}

TEST_F(Formats, UnreadableFilesFailWithAReason) {
  MakePhoto(At("good.jpg"), 1500, 1000);
  WriteBytes(At("text.jpg"), "no image");
  WriteBytes(At("empty.jpg"), "");
  AddAllWaiting({"text.jpg", "good.jpg", "empty.jpg"});
  RenderAll();
  EXPECT_THAT(StateOf("text.jpg"), StartsWith("failed: not an image, or damaged"));
  EXPECT_THAT(StateOf("text.jpg"), HasSubstr("the file is not a known file format"));
  EXPECT_THAT(StateOf("empty.jpg"), StartsWith("failed: not an image, or damaged"));
  EXPECT_EQ(StateOf("good.jpg"), "finished");
  EXPECT_FALSE(std::filesystem::exists(Rendition("text.jpg")));
}

} // namespace
