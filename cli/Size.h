/// Byte counts as people write them, in binary units.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace cli {

/// "10G", "512M", "1.5T", "4096": a decimal number, then nothing or a unit: B, K, M, G, T, P or E, in
/// either case, the latter six also followed by "B" or "iB". Units are powers of 1024. A fraction,
/// of a unit only, is rounded down to whole 512-byte blocks. Nothing for any other text, and for
/// 2^64 and above.
std::optional<uint64_t> parseSize(const std::string &text);

/// "10G", "1.5T", "513": at most two decimals, rounded down; what parseSize reads.
std::string shownSize(uint64_t bytes);

} // namespace cli
