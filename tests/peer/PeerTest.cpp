#include "PeerTest.h"

#include "host/services/Identity.h"
#include "host/state/Database.h"

#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <stdexcept>
#include <sys/wait.h>
#include <unistd.h>

namespace norvhost {
namespace {

std::string makeFolder()
{
    char name[] = "/tmp/peer-tests-XXXXXX";
    return mkdtemp(name);
}

/// The server, which ends when our end of its standard input closes.
class Server {
public:
    Server() : folder(makeFolder())
    {
        int in[2], out[2];
        if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0)
            throw std::runtime_error("no pipes for the server");
        process = fork();
        if (process == 0) {
            dup2(in[0], STDIN_FILENO);
            dup2(out[1], STDOUT_FILENO);
            execl(PYTHON, PYTHON, "-B", BAD_SERVER, folder.c_str(), nullptr);
            _exit(127);
        }
        close(in[0]);
        close(out[1]);
        input = in[1];
        FILE *output = fdopen(out[0], "r");
        unsigned port = 0;
        if (fscanf(output, "%u", &port) != 1)
            throw std::runtime_error("the server does not start");
        fclose(output);
        server.port = static_cast<uint16_t>(port);
        if (iscsihost::fetchPin("127.0.0.1", server.port, server.pin))
            throw std::runtime_error(iscsi_host_last_error());
    }

    ~Server()
    {
        close(input);
        waitpid(process, nullptr, 0);
        std::filesystem::remove_all(folder);
    }

    BadServer server;

private:
    std::string folder;
    pid_t process = -1;
    int input = -1;
};

} // namespace

PeerTest::PeerTest() : root(makeFolder())
{
    setenv("ISCSI_HOST_STATE", (root + "/state").c_str(), 1);
    EXPECT_EQ(0, makeIdentity()) << reason();
}

PeerTest::~PeerTest()
{
    closeDatabase();
    std::error_code ignored;
    std::filesystem::remove_all(root, ignored);
}

const BadServer &badServer()
{
    static const Server server;
    return server.server;
}

iscsihost::HttpsRequest ask(const std::string &behaviour)
{
    iscsihost::HttpsRequest request;
    request.host = "127.0.0.1";
    request.port = badServer().port;
    request.protocol = "https";
    request.path = "/api/v1/luns/" + behaviour;
    request.pin = badServer().pin;
    return request;
}

std::string reason()
{
    return iscsi_host_last_error();
}

} // namespace norvhost
