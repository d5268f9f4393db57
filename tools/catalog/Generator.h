#pragma once

#include <ctime>

namespace orva::db {
class DB;
} // namespace orva::db

// Makes catalogs of any size for files that do not exist. Each function writes in one transaction,
// on the catalog's thread; failures are thrown as std::string.
namespace orva::catalog {

/// The file names in a generated catalog.
enum class Names {
  Unique, ///< every photo has its own name
  Camera, ///< every folder has the same names, numbered as cameras do
};

/// The folder tree of a generated catalog.
enum class Tree {
  Flat, ///< all folders are directly below the root
  Deep, ///< each folder contains eight more, and photos
};

/// The content of a generated catalog: `files` rendered photos, `perFolder` of them in each folder;
/// the last folder may have fewer.
struct GeneratorPlan {
  long long files = 0;
  long long perFolder = 1; ///< at least 1
  Names names = Names::Unique;
  Tree tree = Tree::Flat;
};

/// Replaces the content of `catalog` with what `plan` says. The same plan gives the same rows, with
/// a later stamp. Returns the number of folders.
long long Generate(const db::DB& catalog, const GeneratorPlan& plan, std::time_t now);

/// Gives every transcoding a new stamp, as if all had been rendered again. Returns their number.
long long Restamp(const db::DB& catalog, std::time_t now);

} // namespace orva::catalog
