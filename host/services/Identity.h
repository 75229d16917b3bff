/// Who this appliance is among others: its node UUID and its ROD key.
#pragma once

#include <string>

namespace norvhost {

// Each returns 0 or an error code.

/// Makes what is missing; what was made once stays for the store's life.
int makeIdentity();

/// This appliance's UUID; empty before makeIdentity().
int localNodeId(std::string &uuid);

/// 256 random bits in the alphabet of URLs, 43 characters: the secret from which log-ins between appliances are
/// derived. NORV_ERR_GET_CONFIG before makeIdentity().
int localRodKey(std::string &key);

} // namespace norvhost
