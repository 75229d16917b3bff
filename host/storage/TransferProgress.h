/// Progress files, by which other processes follow exports and imports.
#pragma once

#include "host/core/FileDescriptor.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>

namespace norvhost {

/// What is exported, or imported into.
struct TransferId {
    int lid = 0;
    int snap_id = 0; ///< 0 for an import into the LUN

    bool isExport() const { return snap_id != 0; }
};

/// "L<lid>_S<number>.export_progress" or "L<lid>.import_progress".
std::string progressFileName(const TransferId &id);
bool parseProgressFileName(std::string_view name, TransferId &id);

/// The folder of the progress files, made if missing. NORV_ERR_NO_PERMISSION for a link, or where others could put
/// files of their own.
int openProgressFolder(FileDescriptor &folder);

/// The progress file of one transfer. Readers see it whole: it is replaced, not changed.
class TransferProgress {
public:
    /// Shows the transfer as running, nothing done.
    int begin(const TransferId &id, uint64_t total);

    /// Shows how many bytes are done; not more often than people and programs look.
    void tell(uint64_t done);

    /// Shows how it ended: 0 or an error code. The file stays.
    void finish(int code);

    void remove();

private:
    int write(int step);

    FileDescriptor folder;
    std::string name;
    int running_step = 0;
    uint64_t done_bytes = 0, total_bytes = 0;
    std::chrono::steady_clock::time_point told;
};

} // namespace norvhost
