#include "host/target/ExportLinks.h"

#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/target/Sinks.h"
#include "platform/error.h"

#include <cerrno>
#include <filesystem>
#include <set>
#include <unistd.h>

namespace norvhost {
namespace {

std::string exportFolder()
{
    return runFolder() + "/exports";
}

} // namespace

std::string exportLink(const MappedLun &lun)
{
    return exportFolder() + "/" + lun.uuid + "-" + std::to_string(lun.size);
}

int placeExportLink(const MappedLun &lun)
{
    const std::string link = exportLink(lun);
    std::error_code error;
    if (std::filesystem::read_symlink(link, error) == lun.path)
        return 0;
    if (int err = makeFolder(exportFolder()))
        return err;
    const std::string fresh = link + ".new";
    unlink(fresh.c_str());
    if (symlink(lun.path.c_str(), fresh.c_str()) != 0 || rename(fresh.c_str(), link.c_str()) != 0)
        return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot make the link %s", link.c_str());
    return 0;
}

int removeUnusedExportLinks()
{
    std::set<std::string> used;
    std::vector<_tag_iscsi_target_> targets;
    if (int err = loadTargets(targets))
        return err;
    for (const _tag_iscsi_target_ &target : targets) {
        std::vector<MappedLun> luns;
        if (int err = loadMappedLuns(target.tid, luns))
            return err;
        for (const MappedLun &lun : luns)
            used.insert(exportLink(lun));
    }
    targets.clear();
    if (int err = loadSinkTargets(targets))
        return err;
    for (const _tag_iscsi_target_ &target : targets) {
        MappedLun lun;
        if (int err = loadSinkLun(target.tid, lun))
            return err;
        used.insert(exportLink(lun));
    }
    std::error_code error;
    std::filesystem::directory_iterator entry(exportFolder(), error), end;
    for (; !error && entry != end; entry.increment(error))
        if (used.count(entry->path().string()) == 0)
            unlink(entry->path().c_str());
    return 0;
}

} // namespace norvhost
