/// What a request carries as JSON: read from its query or its body.
#pragma once

#include "webapi/handlers/Input.h"

#include <json/value.h>

#include <string>
#include <string_view>

namespace webapi {

/// Reads a query, "name=value&name=value", percent-encoded and with '+' for a space. A field's type decides what its
/// value becomes; a value that is not of its type, and one of no field, stays a text for checkInput() to refuse. False,
/// with a reason, for a broken encoding, a name twice or a field that no query can carry.
bool readQuery(Fields fields, std::string_view query, Json::Value &input, std::string &reason);

/// Reads a body: one JSON object, UTF-8, nested no deeper than any field is. No body is an empty object.
bool readBody(const std::string &body, Json::Value &input, std::string &reason);

} // namespace webapi
