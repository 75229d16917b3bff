/// The progress file that the platform keeps beside a running import or export.
#pragma once

namespace ISCSI {

/// Reads step, done and total bytes, in that order; `base` is how the byte counts are converted (0
/// takes a "0x" prefix). Returns null, or the first key that could not be read, with the outputs
/// before it set.
const char *readProgressFile(const char *path, int base, unsigned long long &done_bytes,
                             unsigned long long &total_bytes, int &step);

} // namespace ISCSI
