/// The checker program, which tells whether LUNs can be served.
#pragma once

namespace norvhost {

/// Where callers expect the program.
constexpr const char *epck_path = "/usr/norv/sbin/epck";

/// "--vaaick nolog": 0 when the iSCSI service answers, 1 when not; 2 for other arguments. An answer is remembered for
/// a second: a listing with status asks once for each LUN.
int epckMain(int argc, const char *const argv[]);

} // namespace norvhost
