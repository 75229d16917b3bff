/// Export folders: the layout of an exported snapshot, and who may write where.
///
///     export.data    the snapshot's data, holes as holes
///     export.lun     key=value lines: what is needed of the LUN
///     export.record  _tag_iscsi_export_config_, with the snapshot's UUID as its first 36 bytes
///
/// The record gets its name last: a folder without it holds no export, or half of one.
#pragma once

#include "host/core/FileDescriptor.h"
#include "platform/iscsi_snapshot.h"

#include <cstdint>
#include <string>

namespace norvhost {

/// The LUN's side of an export.
struct ExportFacts {
    std::string lun_name;
    int type = 0;
    uint64_t size = 0; ///< bytes of export.data
};

/// A folder that an export is written into. Everything goes by the opened folder: whoever renames it meanwhile moves
/// the export, and links lead nowhere else.
class NewExport {
public:
    /// Opens the folder, making it (not its parents) if missing. NORV_ERR_EXPORT_LOCATION for a path that is not
    /// absolute or lies where LUNs and snapshots do, NORV_ERR_FILE_EXISTS for a folder with files of an export.
    int open(const std::string &destination);

    const std::string &path() const { return canonical_path; }
    bool madeFolder() const { return made; }

    /// Makes export.data, `size` bytes without data. NORV_ERR_OUT_OF_SPACE when there is no room for the `used` bytes
    /// of `source`; on its own file system they may be shared, and only the copying tells.
    int createData(uint64_t size, const FileDescriptor &source, uint64_t used, FileDescriptor &data);

    /// Writes facts and record, all but the record's name.
    int writeRecord(const ExportFacts &facts, const _tag_iscsi_export_config_ &config);

    /// Gives the record its name, durably: the export is there.
    int publish();

    /// Removes what was written, and the folder if it was made.
    void remove();

private:
    int checkSpace(const FileDescriptor &source, uint64_t used) const;

    std::string canonical_path;
    bool made = false;    ///< the folder
    bool created = false; ///< export.data: the folder is this export's
    FileDescriptor folder;
};

/// Removes the files of an export without a record, and the folder if it was made for it. What is complete, and what
/// is not ours, stays.
int removeHalfExport(const std::string &folder, bool made_folder);

/// NORV_ERR_FILE_NOT_FOUND without a record, NORV_ERR_BAD_FILE_SIZE for one that is cut, NORV_ERR_BAD_FILE_TYPE for a
/// file of another kind.
int readExportRecord(const std::string &folder, _tag_iscsi_export_config_ &config);

/// Opens an export for reading: the codes of readExportRecord(), also for its other files.
int openExport(const std::string &folder, ExportFacts &facts, FileDescriptor &data);

} // namespace norvhost
