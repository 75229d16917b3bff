#include "tests/fake/Process.h"

#include "tests/fake/Fake.h"
#include "tests/fake/SharedList.h"

#include <sys/mman.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>

namespace fake {
namespace {

/// An entry is one byte of priority and the text.
SharedList &log()
{
    static SharedList list;
    return list;
}

void note(int priority, const char *format, va_list arguments)
{
    va_list again;
    va_copy(again, arguments);
    const int length = vsnprintf(nullptr, 0, format, again);
    va_end(again);
    std::string text(static_cast<size_t>(length) + 1, '\0');
    vsnprintf(text.data(), text.size(), format, arguments);
    text.pop_back();
    log().append(std::string(1, static_cast<char>(priority)) + text);
}

std::atomic<unsigned int> &slept()
{
    static auto *seconds = [] {
        void *memory =
            mmap(nullptr, sizeof(std::atomic<unsigned int>), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (memory == MAP_FAILED)
            throw std::bad_alloc();
        return new (memory) std::atomic<unsigned int>(0);
    }();
    return *seconds;
}

} // namespace

std::vector<LogLine> logLines()
{
    std::vector<LogLine> lines;
    for (const auto &text : log().texts())
        lines.push_back({text[0], text.substr(1)});
    return lines;
}

void forgetLogLines()
{
    log().clear();
}

unsigned int secondsSlept()
{
    return slept();
}

void forgetSleep()
{
    slept() = 0;
}

} // namespace fake

// The C library's names; a fortified build calls the _chk variants.
extern "C" {

#pragma GCC visibility push(default)

void syslog(int priority, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    fake::note(priority, format, arguments);
    va_end(arguments);
}

void __syslog_chk(int priority, int, const char *format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    fake::note(priority, format, arguments);
    va_end(arguments);
}

unsigned int sleep(unsigned int seconds)
{
    fake::slept() += seconds;
    return 0;
}

// The linker sends calls of free() here, which --wrap asks it to.
void __real_free(void *memory);

void __wrap_free(void *memory)
{
    fake::noteFreed(memory);
    __real_free(memory);
}

#pragma GCC visibility pop
}
