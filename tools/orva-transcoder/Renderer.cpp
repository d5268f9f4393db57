#include "Renderer.h"

#include "Sandbox.h"

#include "orvautil/Exception.h"
#include "orvautil/FormatString.h"
#include "service/Log.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <exception>
#include <map>
#include <regex>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

namespace orva::transcoder {
namespace {

using Numbers = std::vector<std::size_t>;

constexpr long long MOST_PIXELS = 250'000'000;
constexpr char KILLED[] = "the program that renders it was killed, perhaps for lack of memory";
constexpr std::size_t LARGEST_PREVIEW = std::size_t{64} << 20;

/// Writes the largest preview of each raw photo, "$@", to its output. A preview without an
/// orientation gets that of the photo. Ends as exiv2 when that is killed.
constexpr char PREVIEW_SCRIPT[] = R"sh(
for n; do
  rm -f /tmp/*
  exiv2 -q -f -ep -l /tmp "/in/$n"
  [ $? -ne 137 ] || exit 137
  preview=$(ls -S /tmp | head -n 1)
  [ -n "$preview" ] || continue
  if [ -z "$(exiv2 -q -Pv -K Exif.Image.Orientation "/tmp/$preview")" ]; then
    orientation=$(exiv2 -q -Pv -K Exif.Image.Orientation "/in/$n")
    [ -z "$orientation" ] || exiv2 -q -M"set Exif.Image.Orientation $orientation" "/tmp/$preview"
  fi
  cat "/tmp/$preview" >"/out/$n.jpg"
done)sh";

// The usual time of each step of a batch. What is not rendered then is slow.
constexpr std::chrono::seconds USUAL_TIME(5);
constexpr std::chrono::seconds USUAL_TIME_PER_PHOTO(1); // more, for each one that is done

/// Those of a process that works on `photos` photos.
Limits LimitsFor(std::size_t photos) {
  Limits limits;
  limits.processorTime += std::chrono::seconds(photos - 1);
  limits.time += 2 * std::chrono::seconds(photos - 1);
  return limits;
}

/// What is known of an image before it is decoded.
struct Image {
  long long width = 0;
  long long height = 0;
  bool isSrgbJpeg = false;
};

/// Takes a number from the beginning of `text`.
bool TakeNumber(std::string_view& text, long long& number) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  text.remove_prefix(static_cast<std::size_t>(end - text.data()));
  return error == std::errc();
}

bool TakeText(std::string_view& text, std::string_view expected) {
  if (!text.starts_with(expected)) {
    return false;
  }
  text.remove_prefix(expected.size());
  return true;
}

/// Calls `visit` with each line of `text`.
template <typename Visit>
void ForEachLine(std::string_view text, Visit visit) {
  while (!text.empty()) {
    const auto end = std::min(text.find('\n'), text.size());
    visit(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
  }
}

/// The images by number. vipsheader prints "/in/7: 4000x3000 uchar, 3 bands, srgb, jpegload".
std::map<std::size_t, Image> ReadImages(std::string_view output) {
  std::map<std::size_t, Image> images;
  ForEachLine(output, [&images](std::string_view line) {
    long long number = 0;
    Image image;
    if (TakeText(line, "/in/") && TakeNumber(line, number) && TakeText(line, ": ") &&
        TakeNumber(line, image.width) && TakeText(line, "x") && TakeNumber(line, image.height) &&
        number >= 0 && image.width > 0 && image.height > 0) {
      image.isSrgbJpeg = line.ends_with(", srgb, jpegload");
      images.emplace(static_cast<std::size_t>(number), image);
    }
  });
  return images;
}

/// The last line of a program's messages that is not a warning, without the names of the program
/// and of the copy.
std::string LastMessage(std::string_view error) {
  std::string_view last;
  ForEachLine(error, [&last](std::string_view line) {
    if (!line.empty() && line.find("VIPS-WARNING") == std::string_view::npos) {
      last = line;
    }
  });
  for (const std::string_view program : {"vipsheader: ", "/usr/bin/vipsthumbnail: "}) {
    TakeText(last, program);
  }
  static const std::regex COPY("\"?/in/[0-9]+\"?");
  return service::Printable(
      std::regex_replace(std::string(last.substr(0, 1000)), COPY, "the file"));
}

bool Contains(std::string_view text, std::string_view part) {
  return text.find(part) != std::string_view::npos;
}

/// Why a photo has no rendition, for people.
std::string Reason(const Ending& ending, const Limits& limits) {
  if (ending.wasTooSlow) {
    return util::FormatString("took longer than %lld s",
                              static_cast<long long>(limits.processorTime.count()));
  }
  if (Contains(ending.error, "out of memory") || Contains(ending.error, "unable to allocate") ||
      Contains(ending.error, "failed to allocate") ||
      Contains(ending.error, "nsufficient memory") ||
      Contains(ending.error, "annot allocate memory") || Contains(ending.error, "bad_alloc")) {
    return "needs too much memory";
  }
  if (ending.status == 128 + SIGXFSZ) {
    return "its rendition is too large";
  }
  if (ending.status > 128) {
    return util::FormatString("damaged: the program that renders it crashed (signal %d)",
                              ending.status - 128);
  }
  const std::string message = LastMessage(ending.error);
  return message.empty() ? "not an image, or damaged" : "not an image, or damaged: " + message;
}

/// Renders one batch.
class Rendering {
public:
  explicit Rendering(Batch& batch)
      : batch_(batch), hasProfile_(batch.photos.size(), true), pixels_(batch.photos.size()) {}

  void Run() {
    ExtractPreviews();
    ExamineImages();
    BeginStep();
    Numbers photos = Remaining();
    // Small ones do not wait for large ones that may be slow.
    std::ranges::stable_sort(photos, {}, [this](std::size_t number) { return pixels_[number]; });
    for (const bool hasProfile : {false, true}) {
      Numbers alike = photos;
      std::erase_if(alike, [&](std::size_t number) { return hasProfile_[number] != hasProfile; });
      if (alike.size() > 1 && !IsOverdue()) {
        MakeThumbnails(alike, hasProfile);
      }
    }
    // The photos whose process has failed are rendered one by one, so that only the guilty one
    // fails.
    for (const std::size_t number : photos) {
      if (!IsRendition(batch_.folder.OpenOutput(number))) {
        MakeThumbnail(number);
      }
    }
  }

private:
  using Clock = std::chrono::steady_clock;

  /// The photos that may still be rendered in this batch.
  Numbers Remaining() const {
    Numbers numbers;
    for (std::size_t number = 0; number < batch_.photos.size(); ++number) {
      const BatchPhoto& photo = batch_.photos[number];
      if (photo.failure.empty() && photo.obstacle.empty() && !photo.isSlow) {
        numbers.push_back(number);
      }
    }
    return numbers;
  }

  void BeginStep() { stepBegan_ = Clock::now(); }

  /// Whether this step takes longer than usual for the photos that are done.
  bool IsOverdue() const {
    const auto time = Clock::now() - stepBegan_;
    if (batch_.isSlow || time <= USUAL_TIME) {
      return false;
    }
    std::size_t done = 0;
    for (std::size_t number = 0; number < batch_.photos.size(); ++number) {
      done += !batch_.photos[number].failure.empty() || HasOutput(number) ? 1 : 0;
    }
    return time > USUAL_TIME + done * USUAL_TIME_PER_PHOTO;
  }

  /// Leaves the photo to a later batch if this one is overdue.
  bool IsLeftToLater(std::size_t number) {
    batch_.photos[number].isSlow = IsOverdue();
    return batch_.photos[number].isSlow;
  }

  void Fail(std::size_t number, const std::string& reason) {
    batch_.photos[number].failure = reason;
  }

  /// The same for what a program has said. Only a photo that was slow before fails for its time. If
  /// no program works, something else has killed it, or the space for its output is used up, that
  /// is not due to the photo.
  void Fail(std::size_t number, const Ending& ending, const Limits& limits) {
    if (ending.wasTooSlow && !batch_.isSlow) {
      batch_.photos[number].isSlow = true;
      return;
    }
    if (!isSandboxTested_) {
      TestSandbox();
      isSandboxTested_ = true;
    }
    if (ending.WasKilled()) {
      batch_.photos[number].obstacle = KILLED;
    } else if (Contains(ending.error, "No space left on device")) {
      batch_.photos[number].obstacle = "no space in memory to render it";
    } else {
      Fail(number, Reason(ending, limits));
    }
  }

  static void TestSandbox() {
    for (const char* const program : {"/usr/bin/vipsheader", "/usr/bin/vipsthumbnail"}) {
      const Ending ending = RunInSandbox({program, "--version"}, {}, {});
      if (!ending.IsSuccess()) {
        throw util::Exception("the sandbox does not work: " + LastMessage(ending.error));
      }
    }
  }

  Ending Run(std::vector<std::string> command, const Numbers& photos, const char* prefix,
             Limits limits) const {
    limits.isOverdue = [this] { return IsOverdue(); };
    for (const std::size_t number : photos) {
      command.push_back(prefix + std::to_string(number));
    }
    return RunInSandbox(command, {.input = batch_.folder.Input(), .output = batch_.folder.Output()},
                        limits);
  }

  void ExtractPreviews() {
    Numbers raws = Remaining();
    std::erase_if(raws, [this](std::size_t number) { return !batch_.photos[number].isRaw; });
    if (raws.empty()) {
      return;
    }
    BeginStep();
    if (Extract(raws).wasTooSlow) {
      const auto last = std::ranges::find_if(
          raws.rbegin(), raws.rend(), [this](std::size_t number) { return HasOutput(number); });
      if (last != raws.rend()) {
        batch_.photos[*last].isSlow = !batch_.isSlow; // its preview may be incomplete
      }
    }
    for (const std::size_t number : raws) {
      if (!HasOutput(number)) {
        ExtractAlone(number); // it may be missing because of another photo
      }
    }
    for (const std::size_t number : Remaining()) {
      if (batch_.photos[number].isRaw) {
        batch_.folder.UseOutputAsInput(number);
      }
    }
  }

  void ExtractAlone(std::size_t number) {
    if (IsLeftToLater(number)) {
      return;
    }
    const Ending ending = Extract({number});
    if (ending.WasKilled()) {
      batch_.photos[number].obstacle = KILLED;
    } else if (ending.wasTooSlow) {
      Fail(number, ending, LimitsFor(1));
    } else if (!HasOutput(number)) {
      Fail(number, "no preview in this raw photo");
    }
  }

  Ending Extract(const Numbers& photos) const {
    Limits limits = LimitsFor(photos.size());
    limits.fileSize = LARGEST_PREVIEW;
    return Run({"/usr/bin/sh", "-c", PREVIEW_SCRIPT, "sh"}, photos, "", limits);
  }

  bool HasOutput(std::size_t number) const {
    const util::FileDescriptor file = batch_.folder.OpenOutput(number);
    struct stat status {};
    return file && fstat(file.Get(), &status) == 0 && status.st_size > 0;
  }

  /// Fails the photos that are no images or have too many pixels.
  void ExamineImages() {
    const Numbers photos = Remaining();
    if (photos.empty()) {
      return;
    }
    BeginStep();
    const std::vector<std::string> command = {"/usr/bin/vipsheader"};
    const auto images = ReadImages(Run(command, photos, "/in/", LimitsFor(photos.size())).output);
    for (const std::size_t number : photos) {
      const auto image = images.find(number);
      if (image != images.end()) {
        Examine(number, image->second);
        continue;
      }
      if (IsLeftToLater(number)) {
        continue;
      }
      const Limits limits = LimitsFor(1);
      const Ending ending = Run(command, {number}, "/in/", limits);
      const auto alone = ReadImages(ending.output);
      if (alone.contains(number)) {
        Examine(number, alone.at(number));
      } else {
        Fail(number, ending, limits);
      }
    }
  }

  void Examine(std::size_t number, const Image& image) {
    if (image.width > MOST_PIXELS / image.height) {
      Fail(number, util::FormatString("too large: %lld x %lld pixels", image.width, image.height));
    } else {
      pixels_[number] = image.width * image.height;
    }
    // JPEG files have this text before each part of a profile.
    hasProfile_[number] = !image.isSrgbJpeg || batch_.folder.InputContains(number, "ICC_PROFILE");
  }

  /// Without a profile the colours are sRGB, and to convert them would take a fifth of the time.
  Ending MakeThumbnails(const Numbers& photos, bool hasProfile) const {
    // Upright is the default.
    std::vector<std::string> command = {"/usr/bin/vipsthumbnail", "--size", "1024x1024>",
                                        "--output", "/out/%s.jpg[Q=85,strip,background=255]"};
    if (hasProfile) {
      command.insert(command.end(), {"--export-profile", "srgb"});
    }
    return Run(command, photos, "/in/", LimitsFor(photos.size()));
  }

  void MakeThumbnail(std::size_t number) {
    if (IsLeftToLater(number)) {
      return;
    }
    const Ending ending = MakeThumbnails({number}, hasProfile_[number]);
    if (!ending.IsSuccess() || !IsRendition(batch_.folder.OpenOutput(number))) {
      Fail(number, ending, LimitsFor(1));
    }
  }

  Batch& batch_;
  std::vector<bool> hasProfile_;  ///< by number: may have a colour profile, or is not sRGB
  std::vector<long long> pixels_; ///< by number
  Clock::time_point stepBegan_{};
  bool isSandboxTested_ = false;
};

} // namespace

void Render(Batch& batch) {
  try {
    Rendering(batch).Run();
  } catch (const std::exception& exception) {
    batch.error = exception.what();
  }
}

bool IsRendition(const util::FileDescriptor& file) {
  using Marker = std::array<unsigned char, 2>;
  constexpr Marker BEGIN = {0xFF, 0xD8};
  constexpr Marker END = {0xFF, 0xD9};
  struct stat status {};
  Marker begin{};
  Marker end{};
  return file && fstat(file.Get(), &status) == 0 && S_ISREG(status.st_mode) &&
         status.st_size >= 4 && status.st_size <= LARGEST_RENDITION &&
         pread(file.Get(), begin.data(), begin.size(), 0) == 2 && begin == BEGIN &&
         pread(file.Get(), end.data(), end.size(), status.st_size - 2) == 2 && end == END;
}

} // namespace orva::transcoder
