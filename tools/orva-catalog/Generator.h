#pragma once

#include <ctime>

namespace orva::db {
class DB;
} // namespace orva::db

// Catalogs of any size without a file on the volume. On the catalog's thread, each in one
// transaction; failures are thrown as std::string.
namespace orva::catalog {

/// What the photos of a generated catalog are called.
enum class Names {
  Unique, ///< every photo differently
  Camera, ///< the same in every folder, as cameras count them
};

/// How the folders of a generated catalog lie.
enum class Tree {
  Flat, ///< all directly below the root
  Deep, ///< each with eight folders below it, with photos on every level
};

/// The content of a generated catalog: `files` rendered photos, `perFolder` in each folder but
/// the last.
struct GeneratorPlan {
  long long files = 0;
  long long perFolder = 1; ///< at least 1
  Names names = Names::Unique;
  Tree tree = Tree::Flat;
};

/// Replaces the content of `catalog` by what `plan` says. The same plan gives the same rows; only
/// their stamp moves on. Returns the number of folders.
long long Generate(const db::DB& catalog, const GeneratorPlan& plan, std::time_t now);

/// Stamps every transcoding anew, as if all had been rendered again. Returns their number.
long long Restamp(const db::DB& catalog, std::time_t now);

} // namespace orva::catalog
