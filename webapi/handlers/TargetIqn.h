/// Names for targets whose creator gives none.
#pragma once

#include <string>

namespace webapi {

/// "iqn.2001-01.com.example.box:name" for the host box.example.com: lower case, every run of other
/// characters than letters, digits, '-' and '.' a single '-'. Empty when the name holds nothing that
/// an IQN may hold, or the IQN would be longer than 223 bytes.
std::string targetIqn(const std::string &host, const std::string &name);

} // namespace webapi
