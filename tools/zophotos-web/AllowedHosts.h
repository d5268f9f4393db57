#pragma once

#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace orva::web {

/// The names by which a browser may know this server. A page of another site can have its own name
/// resolved to our address and then read what we send: its requests have that name in the Host
/// header. Const operations may run in any thread.
class AllowedHosts {
public:
  /// The names of the loopback, and `names`: host names or addresses without a port. An IPv6
  /// address has brackets or not.
  explicit AllowedHosts(const std::vector<std::string>& names);

  /// Whether the Host header `header` names this server, with any port.
  bool Contains(std::string_view header) const;

  /// Whether it names the address of this end of the connected `socket`. An address in the Host
  /// header cannot be one that another site has had resolved.
  static bool IsLocalAddress(std::string_view header, int socket);

private:
  std::set<std::string> names_; ///< in lower case
};

/// The host in a Host header, in lower case and without the port and brackets; empty for a
/// malformed one.
std::string HostName(std::string_view header);

} // namespace orva::web
