/// A real initiator: libiscsi.
#pragma once

#include <cstdint>
#include <iscsi/iscsi.h>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace e2e {

constexpr int block_size = 512;

/// Where a login goes first.
constexpr int portal_port = 3260, rw_port = 3261, ro_port = 3262;

struct Chap {
    std::string user, secret, mutual_user, mutual_secret;
};

class Initiator {
public:
    explicit Initiator(const std::string &name, std::string address = "127.0.0.1")
        : context(iscsi_create_context(name.c_str())), address(std::move(address))
    {
        iscsi_set_timeout(context.get(), 60);
    }

    iscsi_context *get() const { return context.get(); }
    std::string error() const { return iscsi_get_error(context.get()); }

    void setChap(const Chap &chap);

    /// Target name -> address, "!" when the discovery failed.
    std::map<std::string, std::string> discover(int port = portal_port);

    /// Whether the login to the target succeeded.
    bool logIn(const std::string &target, int port = portal_port);

    /// Size of a unit in bytes, 0 when it does not answer.
    uint64_t capacity(int lun = 1);

    bool write(uint64_t block, uint8_t fill, int lun = 1, uint32_t blocks = 8);
    /// Whether these blocks hold the byte.
    bool holds(uint64_t block, uint8_t fill, int lun = 1, uint32_t blocks = 8);

    /// LUN numbers that the target reports, without its controller.
    std::vector<int> luns();

    /// Serial number and the designators of page 0x83 as one text of bytes.
    std::string serial(int lun = 1);
    std::string identification(int lun = 1);

    /// The port that the session ended up on.
    int port() const;

private:
    struct Destroy {
        void operator()(iscsi_context *iscsi) const { iscsi_destroy_context(iscsi); }
    };
    std::string page(int lun, int code);

    std::unique_ptr<iscsi_context, Destroy> context;
    std::string address;
};

/// Takes the unit attentions that a new session brings.
void clearAttention(iscsi_context *iscsi, int lun);

} // namespace e2e
