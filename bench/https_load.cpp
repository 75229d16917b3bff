// https_load URL CLIENTS SECONDS: so many clients, each with a connection of its own that it keeps, ask for the URL
// over and over; prints the median time of an answer and the answers per second as JSON. $TOKEN, when set, is sent as
// the session's token. The server's certificate is not looked at: the bench has just made it. Any answer but 200 ends
// the run with exit status 1.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <curl/curl.h>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

struct Client {
    std::vector<double> microseconds;
    size_t bytes = 0; ///< of the last answer
    std::string failure;
};

size_t count(char *, size_t size, size_t number, void *bytes)
{
    *static_cast<size_t *>(bytes) += size * number;
    return size * number;
}

/// Asks until the end; what is asked before the start is not counted.
void ask(const std::string &url, Clock::time_point start, Clock::time_point end, Client &client)
{
    const std::unique_ptr<CURL, decltype(&curl_easy_cleanup)> curl(curl_easy_init(), curl_easy_cleanup);
    std::unique_ptr<curl_slist, decltype(&curl_slist_free_all)> headers(nullptr, curl_slist_free_all);
    if (const char *token = getenv("TOKEN"))
        headers.reset(curl_slist_append(nullptr, ("Authorization: Bearer " + std::string(token)).c_str()));
    curl_easy_setopt(curl.get(), CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl.get(), CURLOPT_HTTPHEADER, headers.get());
    curl_easy_setopt(curl.get(), CURLOPT_SSL_VERIFYPEER, 0L);
    curl_easy_setopt(curl.get(), CURLOPT_SSL_VERIFYHOST, 0L);
    curl_easy_setopt(curl.get(), CURLOPT_NOSIGNAL, 1L);
    curl_easy_setopt(curl.get(), CURLOPT_TIMEOUT, 30L);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEFUNCTION, count);
    curl_easy_setopt(curl.get(), CURLOPT_WRITEDATA, &client.bytes);
    for (auto before = Clock::now(); before < end;) {
        client.bytes = 0;
        const CURLcode code = curl_easy_perform(curl.get());
        long status = 0;
        curl_easy_getinfo(curl.get(), CURLINFO_RESPONSE_CODE, &status);
        if (code != CURLE_OK || status != 200) {
            client.failure = code != CURLE_OK ? curl_easy_strerror(code) : "status " + std::to_string(status);
            return;
        }
        const auto after = Clock::now();
        if (before >= start)
            client.microseconds.push_back(std::chrono::duration<double, std::micro>(after - before).count());
        before = after;
    }
}

} // namespace

int main(int argc, char **argv)
{
    if (argc != 4)
        return fprintf(stderr, "usage: https_load URL CLIENTS SECONDS\n"), 2;
    curl_global_init(CURL_GLOBAL_DEFAULT);
    const double seconds = atof(argv[3]);
    const auto start = Clock::now() + std::chrono::milliseconds(300); // connections are made by then
    const auto end = start + std::chrono::duration_cast<Clock::duration>(std::chrono::duration<double>(seconds));
    std::vector<Client> clients(static_cast<size_t>(atoi(argv[2])));
    std::vector<std::thread> threads;
    for (Client &client : clients)
        threads.emplace_back(ask, argv[1], start, end, std::ref(client));
    std::vector<double> all;
    for (std::thread &thread : threads)
        thread.join();
    for (const Client &client : clients) {
        if (!client.failure.empty())
            return fprintf(stderr, "%s: %s\n", argv[1], client.failure.c_str()), 1;
        all.insert(all.end(), client.microseconds.begin(), client.microseconds.end());
    }
    if (all.empty())
        return fprintf(stderr, "%s: no answer in time\n", argv[1]), 1;
    std::nth_element(all.begin(), all.begin() + static_cast<long>(all.size() / 2), all.end());
    printf("{\"median_us\": %.1f, \"per_second\": %.1f, \"bytes\": %zu}\n", all[all.size() / 2],
           static_cast<double>(all.size()) / seconds, clients[0].bytes);
    return 0;
}
