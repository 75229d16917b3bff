// Bytes of a stranger's connection to the login portal. The first byte of an input says how finely the rest is cut up.
#include "host/target/portal/Conversation.h"
#include "tests/fuzz/Expect.h"

#include <algorithm>
#include <cstdint>

using namespace norvhost::portal;

namespace {

constexpr char KNOWN_INITIATOR[] = "iqn.2026-01.com.example:alice";
constexpr char TARGET[] = "iqn.2026-01.com.example:store";
constexpr size_t OUTPUT_MAX = 64 << 10;

/// Serves one target to one initiator, and cannot tell at the first question about a login.
struct OneTarget : Directory {
    bool asked_by_known = false;
    int questions = 0;

    std::vector<std::string> targetsFor(const std::string &initiator) override
    {
        asked_by_known = asked_by_known || initiator == KNOWN_INITIATOR;
        return initiator == KNOWN_INITIATOR ? std::vector<std::string>{TARGET} : std::vector<std::string>{};
    }

    Decision decide(const std::string &initiator, const std::string &target) override
    {
        Decision decision;
        if (++questions == 1)
            decision.later = true;
        else if (initiator == KNOWN_INITIATOR && target == TARGET)
            decision = {login_moved, 3261, false};
        else
            decision.status = login_not_found;
        return decision;
    }
};

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    if (size == 0)
        return 0;
    const size_t piece_size = data[0] ? data[0] : size;
    const std::string_view all(reinterpret_cast<const char *>(data) + 1, size - 1);

    OneTarget directory;
    Conversation conversation(directory, "192.0.2.10", 3260);
    // Pings are echoed: an input that holds the answer tells nothing about who may see it.
    const std::string answer = std::string("TargetName=") + TARGET;
    const bool echo = all.find(answer) != std::string_view::npos;
    for (size_t at = 0; at < all.size() && !conversation.finished(); at += piece_size) {
        std::string_view piece = all.substr(at, piece_size);
        while (!piece.empty() && !conversation.finished()) {
            const size_t before = piece.size();
            conversation.receive(piece);
            if (conversation.waiting())
                directory.questions > 1 ? conversation.giveUp() : conversation.retry();
            std::string &output = conversation.output();
            EXPECT_ALWAYS(output.size() <= OUTPUT_MAX);
            EXPECT_ALWAYS(output.size() % 4 == 0);
            EXPECT_ALWAYS(directory.asked_by_known || echo || output.find(answer) == std::string::npos);
            // It takes bytes, answers, or is done: anything else would spin for ever.
            EXPECT_ALWAYS(piece.size() < before || !output.empty() || conversation.finished());
            output.clear();
        }
    }
    return 0;
}
