#pragma once

#include "zophotos-web/SnapshotReader.h"
#include "zophotos-web/Volume.h"

#include "zophotos/Json.h"

#include <string>

// The JSON of the interface, as doc/web.md describes it. Ids are texts: they can be larger than the
// exact numbers of scripts. Names are UTF-8; U+FFFD replaces other bytes.
namespace orva::web {

using zophotos::Json;

Json ToJson(const Photo& photo);
Json ToJson(const Folder& folder);
Json ToJson(const Volume& volume);
Json ToJson(const Month& month);
Json ToJson(const SnapshotStatus& status);

/// The text of a document.
std::string ToText(const Json& document);

} // namespace orva::web
