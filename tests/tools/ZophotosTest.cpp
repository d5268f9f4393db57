#include "ZophotosTest.h"

#include "support/Programs.h"

#include <cstdlib>
#include <filesystem>

namespace orva::test {

Arguments ZophotosCommand(Arguments arguments) {
  arguments.insert(arguments.begin(), ProgramPath("zophotos"));
  return arguments;
}

Outcome Zophotos(Arguments arguments, const std::string& output) {
  return Run(ZophotosCommand(std::move(arguments)), output);
}

void ZophotosTest::SetUp() {
  setenv("TZ", "UTC", 1);
  onA.AddFolder("Pictures/", 500);
  onA.AddFolder("Pictures/Summer/", 600);
  onA.AddPhoto("top.jpg", 1000, 2000);
  onA.AddPhoto("Pictures/b.jpg", 1001, 2001);
  onA.AddPhoto("Pictures/Summer/a.jpg", 1002, 2002);
  onB.AddFolder("Old/", 700);
  onB.AddPhoto("Old/1.jpg", 86400, 2003);
  AddUntranscoded(onB, "Old/2.jpg");
  AddUntranscoded(onB, "Old/3.jpg");
  AddUntranscoded(onD, "new.jpg");
  appliance.Start();
  for (const Volume* const volume : {&a, &b, &c, &d}) {
    appliance.Handle(Plugged(volume->Path()));
  }
  appliance.Handle(Scanned(a.Path()));
  for (const Volume* const volume : {&a, &b, &c, &d}) {
    Merge(*volume);
  }
}

void ZophotosTest::AddUntranscoded(Catalog& catalog, const std::string& path) {
  catalog.AddPhoto(path, 1, 1);
  catalog.Rows().Run("DELETE FROM Transcodings WHERE sourceId = (SELECT id FROM Files WHERE path = "
                     "?)",
                     {path});
  catalog.Rows().Run("UPDATE Files SET status = 2 WHERE path = ?", {path});
}

Database ZophotosTest::Copy() {
  std::filesystem::create_directories(std::filesystem::path(COPY).parent_path());
  std::filesystem::copy_file(MERGED, COPY, std::filesystem::copy_options::overwrite_existing);
  return Database(COPY);
}

Outcome ZophotosTest::OnCopy(Arguments arguments, const std::string& output) {
  arguments.insert(arguments.begin(), {"--database", COPY});
  return Zophotos(std::move(arguments), output);
}

} // namespace orva::test
