#pragma once

#include <cstddef>
#include <string>
#include <unordered_set>
#include <vector>

namespace orva::test {

/// The files that a test copies to volumes. Each has another size than the others, and a rendition
/// shows which one it was made from.
class Templates {
public:
  /// Real photos in several formats and orientations, and files that cannot be rendered. The photos
  /// are made in a folder at `place`, or read from there if an earlier boot has made them.
  explicit Templates(const std::string& place);

  std::size_t Count() const { return templates_.size(); }
  const std::string& Bytes(std::size_t index) const { return templates_.at(index).bytes; }

  /// Whether it is a photo. The others fail.
  bool IsRenderable(std::size_t index) const { return templates_.at(index).width > 0; }

  /// One that is no photo of the others.
  std::size_t Secret() const { return secret_; }

  /// What is wrong with a rendition of the template; empty if it opens, is upright, has the right
  /// size and no metadata.
  std::string Examine(std::size_t index, const std::string& rendition);

private:
  struct Template {
    std::string bytes{};
    int width = 0; ///< of the rendition
    int height = 0;
    std::string corners{};                        ///< colours of the rendition, clockwise
    std::unordered_set<std::string> renditions{}; ///< that were found right
  };

  void Add(const std::string& path, int width, int height, const std::string& corners = "");
  void AddBytes(const std::string& bytes);
  static std::string LookAt(const Template& photo, const std::string& path);

  std::vector<Template> templates_;
  std::size_t secret_ = 0;
};

} // namespace orva::test
