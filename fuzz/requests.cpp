// The input is what a client sends to zophotos-web. It passes the HTTP server, the checks of
// requests, the routes, the snapshot, and the files of a volume.

#include "Fuzzing.h"

#include "zophotos-web/Router.h"
#include "zophotos-web/Server.h"
#include "zophotos-web/Snapshot.h"

#include <sqlite3.h>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <array>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <string_view>

namespace {

using namespace orva;
using fuzz::Require;

constexpr const char* SOCKET = "/tmp/server";
constexpr const char* MERGED = "/tmp/merged.db";
constexpr std::string_view SECRET = "not on the volume";

void Write(const std::string& path, std::string_view content) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
}

void Execute(const std::string& path, const char* sql) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  sqlite3* database = nullptr;
  Require(sqlite3_open(path.c_str(), &database) == SQLITE_OK &&
              sqlite3_exec(database, sql, nullptr, nullptr, nullptr) == SQLITE_OK,
          "the databases can be made");
  sqlite3_close(database);
}

/// A volume with two photos, and a merged database that also names files elsewhere. The ids of the
/// photos are 4611686020574871553 to 4611686020574871557.
void MakeVolume() {
  Write("/shares/A/a.jpg", "original");
  Write("/shares/A/sea/b.jpg", "original");
  Write("/shares/A/.orva/renditions/0/1.jpg", "rendition");
  Write("/shares/A/.orva/renditions/0/2.jpg", "rendition");
  Write("/shares/secret.jpg", SECRET);
  std::filesystem::create_symlink("../secret.jpg", "/shares/A/link.jpg");
  Execute("/shares/A/.orva/orva.db",
          "CREATE TABLE Files(id INTEGER PRIMARY KEY, path TEXT, isDeleted INTEGER);"
          "INSERT INTO Files VALUES(1, 'a.jpg', 0), (2, 'sea/b.jpg', 0)");
  Execute(
      MERGED,
      "CREATE TABLE Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT NOT NULL, "
      "photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, last_updated_time INTEGER NOT "
      "NULL);"
      "CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id INTEGER "
      "NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL);"
      "CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT NULL, "
      "name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, created_date "
      "INTEGER NOT NULL);"
      "CREATE TABLE Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version CHAR(16) NOT NULL, "
      "mdate INTEGER NOT NULL, desc CHAR(80), etype INTEGER);"
      "INSERT INTO Status(mc_version, mdate, desc, etype) VALUES('2.0', 1000, '', 0);"
      "INSERT INTO Statistics VALUES(1, '/shares/A/', 2, 2, 5);"
      "INSERT INTO Folders VALUES(1, -1, '/shares/', 0, '<DUMMY>'), (2, 1, '/shares/A/', 0, "
      "'/shares/A/'), (3, 2, '/shares/A/sea/', 0, '/shares/A/');"
      "INSERT INTO Files VALUES(1, 2, 'a.jpg', 1, '/shares/A/', 1), (2, 3, 'b.jpg', 1, "
      "'/shares/A/', 1), (3, 2, '../secret.jpg', 1, '/shares/A/', 1), (4, 2, 'link.jpg', 1, "
      "'/shares/A/', 1), (5, 1, 'secret.jpg', 1, '<DUMMY>', 1)");
}

sockaddr_un Address() {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strcpy(address.sun_path, SOCKET);
  return address;
}

util::FileDescriptor Listen() {
  util::FileDescriptor listener(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  const sockaddr_un address = Address();
  Require(bind(listener.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
              listen(listener.Get(), SOMAXCONN) == 0,
          "the server can listen");
  return listener;
}

/// The program without its main function.
struct Program {
  web::Snapshot snapshot{"/tmp/cache", [] { return std::string(MERGED); }};
  web::Router router{snapshot, [](const std::string&) {}};
  web::Server server{
      Listen(), web::AllowedHosts({}),
      web::Server::Handlers{
          .answer = [this](const web::Request& request) { return router.Answer(request); },
          .refuse = &web::Router::Refuse,
          .log = [](const std::string&) { Require(false, "no request makes the program fail"); }}};
};

class Client {
public:
  Client() : socket_(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const sockaddr_un address = Address();
    Require(connect(socket_.Get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) ==
                0,
            "the server takes connections");
  }

  void Send(std::string_view bytes) const {
    while (!bytes.empty()) {
      const ssize_t count = send(socket_.Get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
      if (count <= 0) {
        return; // the server has ended the connection
      }
      bytes.remove_prefix(static_cast<std::size_t>(count));
    }
  }

  void EndRequests() const { shutdown(socket_.Get(), SHUT_WR); }

  /// What arrives until nothing does for so many milliseconds.
  std::string Receive(int pause) const {
    std::string all;
    std::array<char, 65536> bytes{};
    pollfd ready{.fd = socket_.Get(), .events = POLLIN, .revents = 0};
    while (poll(&ready, 1, pause) == 1) {
      const ssize_t count = recv(socket_.Get(), bytes.data(), bytes.size(), 0);
      if (count <= 0) {
        break;
      }
      all.append(bytes.data(), static_cast<std::size_t>(count));
    }
    return all;
  }

private:
  util::FileDescriptor socket_;
};

bool Contains(std::string_view text, std::string_view part) {
  return text.find(part) != std::string_view::npos;
}

std::unique_ptr<Program> program;

/// What the server answers to a request of one line.
std::string Get(const std::string& path) {
  constexpr int EVENTUALLY = 10'000; // milliseconds
  const Client client;
  client.Send("GET " + path + " HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\n\r\n");
  return client.Receive(EVENTUALLY);
}

/// The id of the first photo. Its number depends on the database's inode.
std::int64_t FirstPhoto() {
  const std::string photos = Get("/api/photos");
  constexpr std::string_view LABEL = R"("id":")";
  const std::size_t label = photos.rfind(LABEL, photos.find(R"("name":"a.jpg")"));
  Require(label != std::string::npos, "the first photo is listed");
  return std::stoll(photos.substr(label + LABEL.size()));
}

/// The request with the ids of this run instead of those of the corpus.
std::string WithIds(std::string request) {
  static const std::int64_t firstPhoto = FirstPhoto();
  constexpr std::string_view INSTEAD = "461168602057487155"; // and 3 for the first photo
  for (std::size_t at = 0; (at = request.find(INSTEAD, at)) != std::string::npos; ++at) {
    const std::size_t end = at + INSTEAD.size();
    if (end < request.size() && request[end] >= '3' && request[end] <= '7') {
      request.replace(at, INSTEAD.size() + 1, std::to_string(firstPhoto + (request[end] - '3')));
    }
  }
  return request;
}

} // namespace

int LLVMFuzzerInitialize(int* /*count*/, char*** /*arguments*/) {
  MakeVolume();
  program = std::make_unique<Program>();
  program->snapshot.Update();
  std::atexit([] { program.reset(); });
  return 0;
}

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  constexpr int SOON = 3; // milliseconds
  const Client client;
  client.Send(WithIds({reinterpret_cast<const char*>(data), size}));
  client.EndRequests();
  const std::string output = client.Receive(SOON);
  Require(output.empty() || output.starts_with("HTTP/1.1 "), "the output is a response");
  Require(!Contains(output, SECRET), "nothing is sent that is not on the volume");
  Require(!Contains(output, "HTTP/1.1 500"), "no request makes the program fail");
  Require(!Contains(output, "HTTP/1.1 200") || Contains(output, "Content-Security-Policy: "),
          "each response has the security headers");

  static const std::string photo = WithIds("/photos/4611686020574871553/original");
  Require(Get(photo).ends_with("\r\n\r\noriginal"), "others are served");
  return 0;
}
