/// The platform under test: made empty for a test, and cleared away behind it.
#pragma once

#include <cstddef>
#include <string>

namespace contract {

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

    std::string volume; ///< a location for LUNs, with room for a few small ones
    std::string folder; ///< for the platform's own files; empty
};

/// Copies a text into a character field.
template <size_t size>
void set(char (&field)[size], const std::string &text)
{
    field[text.copy(field, size - 1)] = '\0';
}

} // namespace contract
