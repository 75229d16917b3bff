// Programs, children, lists of texts, key-value files, and the event log. Children and files are real.
#include "platform/core.h"
#include "platform/error.h"
#include "platform/event_log.h"
#include "tests/fake/Script.h"

#include <fcntl.h>
#include <strings.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <fstream>

using namespace fake;

namespace {

std::string trimmed(const std::string &text, const char *what)
{
    const size_t start = text.find_first_not_of(what);
    return start == std::string::npos ? "" : text.substr(start, text.find_last_not_of(what) + 1 - start);
}

int readKeyValue(const char *path, const char *key, std::string &value)
{
    std::ifstream file(path);
    if (!file)
        return -1;
    for (std::string line; std::getline(file, line);) {
        const size_t equals = line.find('=');
        if (equals == std::string::npos || trimmed(line.substr(0, equals), " \t") != key)
            continue;
        value = trimmed(trimmed(line.substr(equals + 1), " \t"), "\"");
        return 1;
    }
    return 0;
}

const char *shown(const char *text)
{
    return text ? text : "(null)";
}

} // namespace

void fake::pushText(NLIBC_SZ_LIST &list, const std::string &text)
{
    if (list.count < list.capacity)
        list.texts[list.count++] = strdup(text.c_str());
}

namespace {

/// A pipe whose writing end every detached child holds, children of children too: it ends with the last of them.
int alive[2] = {-1, -1};

void waitUntilNoneIsAlive()
{
    if (alive[0] < 0)
        return;
    close(alive[1]);
    char byte;
    while (read(alive[0], &byte, 1) < 0 && errno == EINTR) {
    }
    close(alive[0]);
    alive[0] = alive[1] = -1;
}

} // namespace

std::vector<int> fake::waitForChildren()
{
    waitUntilNoneIsAlive();
    std::vector<int> statuses;
    int status = 0;
    while (waitpid(-1, &status, 0) > 0)
        statuses.push_back(WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status));
    return statuses;
}

int NLIBCExec(const char *program, const char *arg1, const char *arg2, const char *arg3, const char *arg4)
{
    std::string arguments = program;
    for (const char *argument : {arg1, arg2, arg3, arg4}) {
        if (!argument)
            break;
        arguments += std::string(", ") + argument;
    }
    NOTE_CALL(arguments);
    return static_cast<int>(answerOf(__func__, model().exit_status));
}

int NLIBCProcForkChildNoWait()
{
    if (auto failure = called(__func__))
        return *failure;
    prctl(PR_SET_CHILD_SUBREAPER, 1); // children of children become ours, and their exit statuses too
    if (alive[0] < 0 && pipe2(alive, O_CLOEXEC) != 0)
        return -1;
    return fork();
}

NLIBC_SZ_LIST *NLIBCSzListAlloc(int capacity)
{
    if (called(__func__, capacity))
        return nullptr;
    return noted(new NLIBC_SZ_LIST{0, capacity, new char *[static_cast<size_t>(capacity)]});
}

void NLIBCSzListFree(NLIBC_SZ_LIST *list)
{
    if (!list)
        return;
    for (int i = 0; i < list->count; ++i)
        free(list->texts[i]);
    delete[] list->texts;
    noteFreed(list);
    delete list;
}

const char *NLIBCSzListGet(const NLIBC_SZ_LIST *list, int index)
{
    if (called(__func__, index))
        return nullptr;
    return index >= 0 && index < list->count ? list->texts[index] : nullptr;
}

int NLIBCFileExist(const char *path)
{
    NOTE_CALL(path);
    if (isPlatforms(path))
        return model().section_files.count(path) != 0 ? 1 : 0;
    return access(path, F_OK) == 0 ? 1 : 0;
}

int NLIBCFileGetKeyValue(const char *path, const char *key, char *value, int size)
{
    NOTE_CALL(path, key, size);
    std::string text;
    const int found = readKeyValue(path, key, text);
    if (found == 1 && text.size() >= static_cast<size_t>(size))
        return -1;
    if (found == 1)
        memcpy(value, text.c_str(), text.size() + 1);
    return found;
}

int NLIBCFileCheckKeyValue(const char *path, const char *key, const char *value, int case_sensitive)
{
    NOTE_CALL(path, key, value, case_sensitive);
    std::string text;
    const int found = readKeyValue(path, key, text);
    const auto compare = case_sensitive ? strcmp : strcasecmp;
    return static_cast<int>(answerOf(__func__, found == 1 ? compare(text.c_str(), value) == 0 : found));
}

int NORVLogSet1(int scope, int level, unsigned int number, const char *text1, const char *text2, const char *text3,
                const char *text4)
{
    char number_text[16];
    snprintf(number_text, sizeof(number_text), "0x%08x", number);
    return called(__func__, scope, level, number_text, shown(text1), shown(text2), shown(text3), shown(text4))
        .value_or(level < 1 || level > 3 ? NORV_ERR_BAD_PARAMETER : 0);
}
