/// The platform under test: made empty for a test, and cleared away behind it.
#pragma once

#include "platform/iscsi_lun.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <string>

namespace contract {

constexpr uint64_t MIB = 1 << 20;
constexpr const char *NO_UUID = "ffffffff-ffff-4fff-bfff-ffffffffffff";

/// Copies a text into a character field.
template <size_t size>
void set(char (&field)[size], const std::string &text)
{
    field[text.copy(field, size - 1)] = '\0';
}

class Platform {
public:
    Platform();
    ~Platform();
    Platform(const Platform &) = delete;
    Platform &operator=(const Platform &) = delete;

    /// Runs the iSCSI service, which targets need.
    void startService();

    /// Adds what the platform's functions only look up and remove.
    void addSnapshotTask(int lid, const std::string &lun_name);
    void addScheduledSnapshots(int lid);
    void addRetentionPolicy(int lid); ///< keeps the newest snapshot

    /// Takes the user's lock and the applications' from a snapshot, so that it can be deleted.
    void unlock(const char *snapshot_uuid);

    _tag_iscsi_lun_ request(const std::string &name, int type = NORV_LUN_TYPE_ADV, uint64_t size = 4 * MIB) const
    {
        _tag_iscsi_lun_ lun{};
        lun.type = type;
        lun.size = size;
        set(lun.name, name);
        set(lun.location, volume);
        return lun;
    }
    _tag_iscsi_lun_ createLUN(const std::string &name, int type = NORV_LUN_TYPE_ADV) const
    {
        _tag_iscsi_lun_ lun = request(name, type);
        EXPECT_EQ(NORViSCSILunCreate(&lun), 0) << name;
        return lun;
    }

    std::string volume; ///< a location for LUNs, with room for a few small ones
    std::string folder; ///< for the platform's own files; empty
};

} // namespace contract
