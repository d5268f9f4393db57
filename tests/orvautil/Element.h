#pragma once

#include <stdexcept>
#include <string>
#include <vector>

namespace orva::test {

/// What an owning container holds; a derived object tells when it is deleted.
struct Element {
  virtual ~Element() noexcept(false) = default;
};

/// Writes its name into a list when it is deleted through its base.
struct Named : Element {
  Named(std::vector<std::string>& list, const char* itsName) : deleted(list), name(itsName) {}
  ~Named() override { deleted.push_back(name); }

  std::vector<std::string>& deleted;
  std::string name;
};

/// The same, and throws then.
struct Throwing : Named {
  using Named::Named;
  ~Throwing() noexcept(false) override { throw std::runtime_error(name); }
};

} // namespace orva::test
