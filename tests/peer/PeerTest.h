/// A state store of its own for each test, and one badly behaved server for the run.
#pragma once

#include <cstdint>
#include <gtest/gtest.h>
#include <iscsihost/https.h>
#include <iscsihost/node.h>
#include <string>

namespace norvhost {

class PeerTest : public testing::Test {
protected:
    PeerTest();
    ~PeerTest() override;

    std::string root; ///< the test's folder
};

/// server.py. Its key is pinned by the tests that want it so.
struct BadServer {
    uint16_t port = 0;
    std::string pin;
};

const BadServer &badServer();

/// A request to it; `behaviour` as in server.py, or an unknown one, whose answer repeats the request.
iscsihost::HttpsRequest ask(const std::string &behaviour);

std::string reason();

} // namespace norvhost
