#pragma once

#include <stdexcept>
#include <string>
#include <vector>

namespace orva::test {

/// An element of an owning container.
struct Element {
  virtual ~Element() noexcept(false) = default;
};

/// Appends its name to a list when it is deleted.
struct Named : Element {
  Named(std::vector<std::string>& list, const char* itsName) : deleted(list), name(itsName) {}
  ~Named() override { deleted.push_back(name); }

  std::vector<std::string>& deleted;
  std::string name;
};

/// The same, and then throws.
struct Throwing : Named {
  using Named::Named;
  ~Throwing() noexcept(false) override { throw std::runtime_error(name); }
};

} // namespace orva::test
