/// The description of the web API.
#pragma once

#include <json/value.h>

#include <string>
#include <vector>

namespace webapi {

/// The table of routes as an OpenAPI 3 document.
Json::Value openApi();

/// Where the table and the texts disagree: routes, parameters or fields without a text, texts of none, answers of no
/// known form. Empty when all is well.
std::vector<std::string> openApiProblems();

} // namespace webapi
