#include "Options.h"

#include "AllowedHosts.h"
#include "SocketAddress.h"

#include "commandline/Parse.h"

#include <arpa/inet.h>

#include <utility>

namespace orva::web {
namespace {

/// For Option::check.
CLI::Validator AddressAndPort() {
  return {[](const std::string& text) {
            return SocketAddress::Parse(text)
                       ? std::string()
                       : "takes an address and a port, as in 127.0.0.1:8480 or [::1]:8480, not '" +
                             text + "'";
          },
          ""};
}

/// A host name in lower case or an address; one of IPv6 may have brackets.
bool IsHost(const std::string& text) {
  in6_addr address{};
  const bool hasBrackets = text.starts_with('[') && text.ends_with(']');
  const std::string plain = hasBrackets ? text.substr(1, text.size() - 2) : text;
  return inet_pton(AF_INET6, plain.c_str(), &address) == 1 ||
         (HostName(text) == text && !text.empty());
}

/// For Option::check.
CLI::Validator HostNames() {
  return {[](const std::string& text) {
            return IsHost(text) ? std::string()
                                : "takes a host name in lower case or an address, without a "
                                  "port, not '" +
                                      text + "'";
          },
          ""};
}

} // namespace

std::optional<Options> ParseOptions(std::vector<std::string> arguments) {
  Options options;
  CLI::App app{"Shows the photos of all volumes as a web page. Never changes them.",
               "zophotos-web"};
  app.set_version_flag("--version", "zophotos-web " PROGRAM_VERSION);
  app.option_defaults()->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
  app.option_defaults()->disable_flag_override();
  app.add_option("--listen", options.listen,
                 "Serve at this address instead of systemd's socket or 127.0.0.1:8480; port 0: any")
      ->type_name("ADDRESS:PORT")
      ->check(AddressAndPort());
  app.add_flag("--allow-everybody", options.allowsEverybody,
               "Allow an address that other machines can reach: everybody who reaches it sees all "
               "photos");
  app.add_option("--host", options.hosts,
                 "A name or address by which browsers know this server, as behind a proxy; may be "
                 "repeated")
      ->type_name("NAME")
      ->check(HostNames())
      ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  app.add_option("--cache", options.cache,
                 "Keep the snapshot in this directory instead of ~/.cache/zophotos-web")
      ->type_name("DIRECTORY")
      ->check(commandline::NotEmpty());
  app.footer("Exit status: 0 stopped by a signal; 1 failed; 2 wrong command line;\n"
             "3 other machines can reach the address.\n"
             "See zophotos-web(8).");
  if (!commandline::Parse(app, std::move(arguments), false)) {
    return std::nullopt;
  }
  return options;
}

} // namespace orva::web
