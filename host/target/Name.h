/// iSCSI names of targets and initiators.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace norvhost {

constexpr size_t iscsi_name_max = 223; ///< bytes; RFC 7143, 4.2.7.1

/// Puts a name into the form in which names are compared, lower case (RFC 3722). False when it is no
/// name of the forms "iqn.", "eui." and "naa." (RFC 7143, 4.2.7); `normal` is set on success only.
/// The underscore, which the standard has not, is let pass: initiators in use have it.
bool normaliseName(std::string_view name, std::string &normal);

/// As normaliseName() for a target, whose name must also be one that tgtd takes: no underscore.
bool normaliseTargetName(std::string_view name, std::string &normal);

} // namespace norvhost
