/// The key and certificate of the web server: one PEM file below the state folder.
#pragma once

namespace norvhost {

/// Makes one unless there is one.
int provideCertificate();

} // namespace norvhost
