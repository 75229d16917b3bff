// The node record in the node configuration file.
#include "iscsiwebapi/ISCSINodeInfo.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/PlatformAnswers.h"
#include "platform/core.h"

#include <cstdlib>

namespace ISCSI {
namespace {

constexpr const char *CONFIG_FILE = "/usr/norv/etc/iscsi_node.conf";
constexpr const char *LOCK_FILE = "/tmp/iscsi_node.conf.lock";
constexpr const char *LINE_FORMAT = "\t%s=%s\n";
constexpr int CAPACITY = 1024;

/// The lock that every reader and writer of the configuration file holds.
class ConfigLock {
public:
    ConfigLock() = default;
    ConfigLock(const ConfigLock &) = delete;
    ConfigLock &operator=(const ConfigLock &) = delete;
    ~ConfigLock() { release(); }

    int take(Site caller = here())
    {
        site = caller;
        if (!NLIBCFileLockByFile(LOCK_FILE, 1, &fd)) {
            fd = NONE;
            return failText(site, ERR_FAILED_TO_LOCK_FILE, "Failed to lock: %s", LOCK_FILE);
        }
        return 0;
    }

    int release()
    {
        if (fd == NONE)
            return 0;
        const int held = fd;
        fd = NONE;
        if (!NLIBCFileUnlockByFile(held))
            return failText(site, ERR_FAILED_TO_UNLOCK_FILE, "Failed to unlock: %s", LOCK_FILE);
        return 0;
    }

private:
    static constexpr int NONE = -1;

    int fd = NONE;
    Site site{};
};

int allocate(TextHash &hash, Site site = here())
{
    hash.reset(NLIBCSzHashAlloc(CAPACITY));
    if (!hash)
        return failText(site, ERR_OUT_OF_MEMORY, "Failed to allocate hash memory, norverr=0x%04X",
                        static_cast<unsigned int>(NLIBCErrGet()));
    return 0;
}

/// Takes a key of a section; false when the section lacks it.
bool take(const TextHash &section, const char *key, std::string &out)
{
    const char *value = NLIBCSzHashGetValue(section.get(), key);
    if (value)
        out = value;
    return value != nullptr;
}

} // namespace

int ISCSINodeInfo::loadFromConfig()
{
    if (uuid.empty())
        return failText(here(), ERR_BAD_NODE_UUID, "Node UUID is empty");
    TextHash section;
    if (int err = allocate(section))
        return err;
    ConfigLock lock;
    if (int err = lock.take())
        return err;
    if (!NLIBCFileExist(CONFIG_FILE))
        return ERR_FILE_NOT_FOUND;
    if (NLIBCFileGetSection(CONFIG_FILE, uuid.c_str(), section.get()) < 1)
        return ERR_NO_SUCH_NODE;
    ISCSINodeInfo read = *this;
    std::string port_text;
    const bool complete = take(section, "hostname", read.hostname) && take(section, "port", port_text) &&
                          take(section, "protocol", read.protocol) && take(section, "rod_key", read.rod_key) &&
                          take(section, "account", read.account) && take(section, "session_id", read.session_id);
    if (!complete)
        return failText(here(), ERR_FAILED_TO_LOAD_NODE_CONFIG, "Failed to get node info: %s", uuid.c_str());
    read.port = static_cast<unsigned short>(strtol(port_text.c_str(), nullptr, 10));
    *this = std::move(read);
    return 0;
}

int ISCSINodeInfo::updateConfig(bool create, bool update)
{
    TextHash section;
    if (int err = allocate(section))
        return err;
    ConfigLock lock;
    if (int err = lock.take())
        return err;
    bool exists = false;
    if (NLIBCFileExist(CONFIG_FILE)) {
        const int found = NLIBCFileGetSection(CONFIG_FILE, uuid.c_str(), section.get());
        if (found < 0)
            return failText(here(), ERR_FAILED_TO_GET_FILE_SESSION,
                            "Failed to get section: %s from /usr/norv/etc/iscsi_node.conf, errno=0x%04X", uuid.c_str(),
                            static_cast<unsigned int>(NLIBCErrGet()));
        exists = found > 0;
        if (exists && !update)
            return ERR_NODE_UUID_EXISTS;
        if (!exists && !create)
            return ERR_NO_SUCH_NODE;
    }

    char port_text[64];
    if (int err = StringCopy(port_text, port))
        return failText(here(), err, "Failed to copy port. lun: %s", logText(*this).c_str());
    const struct {
        const char *key;
        const char *value;
    } keys[] = {
        {"hostname", hostname.c_str()}, {"port", port_text},          {"protocol", protocol.c_str()},
        {"rod_key", rod_key.c_str()},   {"account", account.c_str()}, {"session_id", session_id.c_str()},
    };
    for (const auto &[key, value] : keys) {
        if (NLIBCSzHashSetValue(section.get(), key, value) < 0)
            return failText(here(), ERR_FAILED_TO_SET_HASH_VALUE, "Failed to set hash value: %s", key);
    }

    if (exists) {
        if (NLIBCFileSetSection(CONFIG_FILE, uuid.c_str(), uuid.c_str(), section.get(), LINE_FORMAT) <= 0)
            return failText(here(), ERR_FAILED_TO_SET_FILE_SESSION,
                            "Failed to set section: %s from /usr/norv/etc/iscsi_node.conf, errno=0x%04X", uuid.c_str(),
                            static_cast<unsigned int>(NLIBCErrGet()));
        return 0;
    }
    if (NLIBCFileTouch(CONFIG_FILE) < 0)
        return failText(here(), ERR_FAILED_TO_TOUCH_FILE, "Failed to touch /usr/norv/etc/iscsi_node.conf");
    if (NLIBCFileAddSection(CONFIG_FILE, uuid.c_str(), section.get(), LINE_FORMAT) <= 0)
        return failText(here(), ERR_FAILED_TO_ADD_FILE_SESSION,
                        "Failed to add section: %s from /usr/norv/etc/iscsi_node.conf, errno=0x%04X", uuid.c_str(),
                        static_cast<unsigned int>(NLIBCErrGet()));
    return 0;
}

bool ISCSINodeInfo::isInConfig() const
{
    if (uuid.empty())
        return false;
    TextHash section;
    ConfigLock lock;
    if (allocate(section) || lock.take())
        return false;
    return NLIBCFileExist(CONFIG_FILE) && NLIBCFileGetSection(CONFIG_FILE, uuid.c_str(), section.get()) > 0;
}

int ISCSINodeInfo::deleteFromNodeConfig() const
{
    ConfigLock lock;
    if (int err = lock.take())
        return err;
    if (NLIBCFileExist(CONFIG_FILE) && NLIBCFileRemoveSection(CONFIG_FILE, uuid.c_str()) < 0)
        return failText(here(), ERR_FAILED_TO_REMOVE_FILE_SESSION,
                        "Failed to remove section: %s from /usr/norv/etc/iscsi_node.conf, errno=0x%04X", uuid.c_str(),
                        static_cast<unsigned int>(NLIBCErrGet()));
    return 0;
}

int ISCSINodeInfo::ListNodeFromConfig(std::vector<ISCSINodeInfo> &out)
{
    TextHash hash;
    if (int err = allocate(hash))
        return err;
    const TextList names(NLIBCSzListAlloc(CAPACITY));
    if (!names)
        return failText(here(), ERR_OUT_OF_MEMORY, "Failed to allocate list memory, norverr=0x%04X",
                        static_cast<unsigned int>(NLIBCErrGet()));
    out.clear();
    ConfigLock lock;
    if (int err = lock.take())
        return err;
    if (!NLIBCFileExist(CONFIG_FILE))
        return 0;
    if (NLIBCFileEnumSection(CONFIG_FILE, names.get()) < 0)
        return failText(here(), ERR_FAILED_TO_ENUMERATE_SECTION, "Failed to NLIBCFileEnumSection %s, errno=0x%04X",
                        CONFIG_FILE, static_cast<unsigned int>(NLIBCErrGet()));
    // Loading a section takes the lock itself.
    if (int err = lock.release())
        return err;
    for (int i = 0; i < names->count; ++i) {
        const char *name = NLIBCSzListGet(names.get(), i);
        ISCSINodeInfo node(name ? name : "");
        if (node.loadFromConfig())
            return failText(here(), ERR_FAILED_TO_LOAD_NODE_CONFIG, "Failed to load node info: %s, errno=0x%04X",
                            node.uuid.c_str(), static_cast<unsigned int>(NLIBCErrGet()));
        out.push_back(std::move(node));
    }
    return 0;
}

} // namespace ISCSI
