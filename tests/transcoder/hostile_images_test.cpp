#include "transcoder/Photos.h"
#include "transcoder/TranscoderTest.h"

#include <gmock/gmock.h>

#include <cstdint>
#include <random>

namespace {

using namespace orva::test;
using testing::StartsWith;

using HostileImages = TranscoderTest;

std::string BigEndian(std::uint32_t number) {
  std::string bytes;
  for (int shift = 24; shift >= 0; shift -= 8) {
    bytes += static_cast<char>(number >> shift & 0xFF);
  }
  return bytes;
}

std::string Chunk(const std::string& type, const std::string& data) {
  std::uint32_t crc = 0xFFFFFFFF;
  for (const char byte : type + data) {
    crc ^= static_cast<unsigned char>(byte);
    for (int bit = 0; bit < 8; ++bit) {
      crc = crc >> 1 ^ ((crc & 1) != 0 ? 0xEDB88320 : 0);
    }
  }
  return BigEndian(static_cast<std::uint32_t>(data.size())) + type + data + BigEndian(~crc);
}

/// Three samples for each pixel.
const std::string OF_8_BITS("\x08\x02\0\0\0", 5);
const std::string OF_16_BITS_INTERLACED("\x10\x02\0\0\x01", 5);

/// A PNG that claims a size, with no image in it.
std::string Png(std::uint32_t width, std::uint32_t height, const std::string& samples = OF_8_BITS) {
  return "\x89PNG\r\n\x1a\n" + Chunk("IHDR", BigEndian(width) + BigEndian(height) + samples) +
         Chunk("IDAT", "x") + Chunk("IEND", "");
}

/// A GIF with one frame that claims a size.
std::string Gif(int width, int height) {
  std::string size;
  for (const int number : {width, height}) {
    size += {static_cast<char>(number & 0xFF), static_cast<char>(number >> 8)};
  }
  return "GIF89a" + size + std::string("\x80\0\0\0\0\0\xFF\xFF\xFF", 9) +
         std::string(",\0\0\0\0", 5) + size + std::string("\0\x02\x02\x44\x01\0;", 7);
}

std::string Tiff(std::uint32_t width, std::uint32_t height) {
  std::string bytes = RawFile("", 1);
  for (const auto& [offset, number] : {std::pair{18, width}, std::pair{30, height}}) {
    for (int i = 0; i < 4; ++i) {
      bytes.at(static_cast<std::size_t>(offset) + static_cast<std::size_t>(i)) =
          static_cast<char>(number >> (8 * i) & 0xFF);
    }
  }
  return bytes;
}

TEST_F(HostileImages, HugeDimensionsFailWithoutBeingDecoded) {
  WriteBytes(At("bomb.png"), Png(60000, 60000));
  WriteBytes(At("bomb.gif"), Gif(65535, 65535));
  WriteBytes(At("limit.png"), Png(20000, 13000)); // 260 megapixels
  MakePhoto(At("good.jpg"), 1500, 1000);
  AddAllWaiting({"bomb.png", "bomb.gif", "limit.png", "good.jpg"});
  RenderAll();
  EXPECT_EQ(StateOf("bomb.png"), "failed: too large: 60000 x 60000 pixels");
  EXPECT_EQ(StateOf("bomb.gif"), "failed: too large: 65535 x 65535 pixels");
  EXPECT_EQ(StateOf("limit.png"), "failed: too large: 20000 x 13000 pixels");
  EXPECT_EQ(StateOf("good.jpg"), "finished");
}

TEST_F(HostileImages, AnImageThatNeedsTooMuchMemoryFailsAlone) {
  // An interlaced image has to be in memory as a whole: 1.4 GiB.
  WriteBytes(At("interlaced.png"), Png(15872, 15616, OF_16_BITS_INTERLACED));
  MakePhoto(At("good.jpg"), 1500, 1000);
  AddAllWaiting({"interlaced.png", "good.jpg"});
  RenderAll();
  EXPECT_EQ(StateOf("interlaced.png"), "failed: needs too much memory");
  EXPECT_EQ(StateOf("good.jpg"), "finished");
}

TEST_F(HostileImages, MalformedFilesCostNothingElse) {
  Lines names;
  Lines good;
  const auto add = [&](const std::string& name, const std::string& bytes) {
    WriteBytes(At(name), bytes);
    names.push_back(name);
  };
  std::mt19937 random(1);
  for (const char* const extension : {"jpg", "png", "webp", "tif", "gif", "heic"}) {
    const std::string name = std::string("good.") + extension;
    MakePhoto(At(name), 1500, 1000);
    good.push_back(name);
    const std::string bytes = ReadBytes(At(name));
    add(std::string("cut.") + extension, bytes.substr(0, bytes.size() / 2));
    add(std::string("head.") + extension, bytes.substr(0, 40));
    std::string noise = bytes.substr(0, 32);
    for (int i = 0; i < 20000; ++i) {
      noise += static_cast<char>(random());
    }
    add(std::string("noise.") + extension, noise);
    for (int copy = 0; copy < 5; ++copy) {
      std::string changed = bytes;
      for (int change = 0; change < 20; ++change) {
        changed.at(random() % changed.size()) = static_cast<char>(random());
      }
      add(std::to_string(copy) + '.' + extension, changed);
    }
  }
  add("bomb.tif", Tiff(0xFFFFFFFF, 0xFFFFFFFF));
  add("drawing.png", "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"9\" height=\"9\"/>");
  add("script.jpg", "push graphic-context\nimage over 0,0 0,0 'https://example.org/'");
  names.insert(names.end(), good.begin(), good.end());
  AddAllWaiting(names);
  RenderAll();
  for (const std::string& name : good) {
    EXPECT_EQ(StateOf(name), "finished") << name;
  }
  for (const std::string& name : names) {
    SCOPED_TRACE(name);
    if (StateOf(name) == "finished") {
      DecodeAll(Rendition(name)); // what could be read of it
    } else {
      EXPECT_THAT(StateOf(name), StartsWith("failed: "));
      EXPECT_FALSE(std::filesystem::exists(Rendition(name)));
    }
  }
  for (const char* const name :
       {"head.jpg", "noise.png", "bomb.tif", "drawing.png", "script.jpg"}) {
    EXPECT_THAT(StateOf(name), StartsWith("failed: ")) << name;
  }
  EXPECT_TRUE(Await([] { return std::filesystem::is_empty(std::string(RUNTIME) + "/staging"); }));
}

TEST_F(HostileImages, NamesDoNotMatter) {
  const Lines names = {
      "-rf.jpg",    "--help.jpg",    "%s.jpg",        "a\nb.jpg",
      "a'b\"c.jpg", "$(reboot).jpg", "a[page=2].jpg", "\xFF\xFE.jpg",
      " .jpg",      "a;b&c|d.jpg",   "`x`.jpg",       "*.jpg",
      "\\.jpg",     "{}.jpg",        "a\tb.jpg",      std::string(251, 'n') + ".jpg"};
  MakePhoto("/tmp/photo.jpg", 60, 40);
  for (const std::string& name : names) {
    std::filesystem::copy_file("/tmp/photo.jpg", At(name));
  }
  AddAllWaiting(names);
  RenderAll();
  for (const std::string& name : names) {
    EXPECT_EQ(StateOf(name), "finished") << name;
    EXPECT_EQ(HeaderOf(Rendition(name)).width, 60) << name;
  }
}

TEST_F(HostileImages, AFileThatIsTooLargeIsNotCopied) {
  WriteBytes(At("sparse.jpg"), "x");
  std::filesystem::resize_file(At("sparse.jpg"), (512ULL << 20) + 1);
  AddWaiting("sparse.jpg");
  RenderAll();
  EXPECT_EQ(StateOf("sparse.jpg"), "failed: the file is larger than 512 MiB");
}

} // namespace
