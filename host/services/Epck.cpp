#include "host/services/Epck.h"

#include "host/target/Service.h"

#include <chrono>
#include <string_view>

namespace norvhost {
namespace {

using Clock = std::chrono::steady_clock;

bool serviceAnswers()
{
    thread_local Clock::time_point asked;
    thread_local bool answer = false;
    const Clock::time_point now = Clock::now();
    if (asked == Clock::time_point() || now - asked > std::chrono::seconds(1)) {
        answer = iscsiServiceAlive();
        asked = Clock::now();
    }
    return answer;
}

} // namespace

int epckMain(int argc, const char *const argv[])
{
    if (argc != 3 || argv[1] != std::string_view("--vaaick") || argv[2] != std::string_view("nolog"))
        return 2;
    return serviceAnswers() ? 0 : 1;
}

} // namespace norvhost
