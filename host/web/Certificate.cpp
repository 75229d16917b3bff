#include "host/web/Certificate.h"

#include "host/core/Crypto.h"
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/core/Paths.h"
#include "host/core/Process.h"
#include "iscsihost/web.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace norvhost {
namespace {

constexpr int openssl_seconds = 60;
constexpr off_t pem_max_bytes = 1 << 20;
constexpr const char *validity_days = "3650"; // peers pin the key; a new certificate is a new pin
constexpr size_t common_name_max = 64;        // RFC 5280, ub-common-name

std::string folder()
{
    return stateFolder() + "/web";
}

std::string certificatePath()
{
    return folder() + "/server.pem";
}

std::string newPath()
{
    return certificatePath() + ".new";
}

int openssl(std::vector<std::string> arguments, const char *what, std::string &output)
{
    ProgramRun run;
    run.arguments = std::move(arguments);
    run.arguments.insert(run.arguments.begin(), "openssl");
    run.timeout_seconds = openssl_seconds;
    ProgramResult result;
    if (int err = runProgram(run, result))
        return err;
    if (result.status != 0)
        return fail(NORV_ERR_BAD_PARAMETER, "%s: %s", what, lastLine(result.errors).c_str());
    output = std::move(result.output);
    return 0;
}

/// The machine's name where it can stand in a certificate, else nothing.
std::string machineName()
{
    char name[256] = "";
    gethostname(name, sizeof name - 1);
    const std::string text(name);
    const bool good = std::all_of(text.begin(), text.end(), [](unsigned char c) {
        return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '-' || c == '.';
    });
    return good && text.size() <= common_name_max ? text : "";
}

/// Writes the file that is to take the certificate's place.
int writeNew(const std::string &text)
{
    if (int err = makeFolder(folder()))
        return err;
    const std::string path = newPath();
    unlink(path.c_str());
    const FileDescriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    if (!file)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot make %s", path.c_str());
    const ssize_t written = write(file.get(), text.data(), text.size());
    const bool whole = written == static_cast<ssize_t>(text.size());
    if (!whole || fsync(file.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, whole || written < 0 ? errno : ENOSPC, "cannot write %s", path.c_str());
    return 0;
}

int putNewInPlace()
{
    if (rename(newPath().c_str(), certificatePath().c_str()) != 0)
        return failErrno(NORV_ERR_RENAME_FILE, errno, "cannot rename %s", newPath().c_str());
    const FileDescriptor directory(open(folder().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory || fsync(directory.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush %s", folder().c_str());
    return 0;
}

int readPem(const std::string &path, std::string &text)
{
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    struct stat status;
    if (!file || fstat(file.get(), &status) != 0)
        return failErrno(NORV_ERR_FILE_NOT_FOUND, errno, "%s", path.c_str());
    if (!S_ISREG(status.st_mode) || status.st_size > pem_max_bytes)
        return fail(NORV_ERR_BAD_FILE_SIZE, "%s: no PEM file", path.c_str());
    text.assign(static_cast<size_t>(status.st_size), '\0');
    const ssize_t got = read(file.get(), text.data(), text.size());
    if (got < 0)
        return failErrno(NORV_ERR_READ_FILE, errno, "%s", path.c_str());
    text.resize(static_cast<size_t>(got));
    return 0;
}

int publicKey(const std::string &pem_file, std::string &key)
{
    return openssl({"x509", "-in", pem_file, "-noout", "-pubkey"}, "certificate", key);
}

/// The base64 between a PEM text's first and last line, decoded.
std::string fromPem(const std::string &pem)
{
    const size_t begin = pem.find('\n');
    const size_t end = pem.find("\n-----END");
    return begin == pem.npos || end == pem.npos ? "" : fromBase64(std::string_view(pem).substr(begin, end - begin));
}

/// What follows `label` on its line, or on the line after it.
std::string valueOf(const std::string &text, const std::string &label)
{
    size_t begin = text.find(label);
    if (begin == text.npos)
        return "";
    begin = text.find_first_not_of(" \n", begin + label.size());
    return begin == text.npos ? "" : text.substr(begin, text.find('\n', begin) - begin);
}

} // namespace

int provideCertificate()
{
    return access(certificatePath().c_str(), F_OK) == 0 ? 0 : iscsihost::makeWebCertificate();
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int makeWebCertificate()
{
    const std::string name = machineName();
    const std::string names = (name.empty() ? "" : "DNS:" + name + ",") + "DNS:localhost,IP:127.0.0.1,IP:::1";
    // The key passes through memory only.
    std::string pem;
    if (int err = openssl({"req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1", "-nodes",
                           "-days", validity_days, "-subj", "/CN=" + (name.empty() ? "iscsi-webapi" : name), "-addext",
                           "subjectAltName=" + names, "-keyout", "-"},
                          "making a certificate", pem))
        return err;
    if (int err = writeNew(pem))
        return err;
    return putNewInPlace();
}

int setWebCertificate(const std::string &certificate_file, const std::string &key_file)
{
    std::string certificates, key;
    if (int err = readPem(certificate_file, certificates))
        return err;
    if (int err = readPem(key_file, key))
        return err;
    if (int err = writeNew(certificates + "\n" + key))
        return err;
    std::string shown, held;
    int err = publicKey(newPath(), shown);
    if (!err)
        err = openssl({"pkey", "-in", newPath(), "-passin", "pass:", "-pubout"}, "key (without a passphrase)", held);
    if (!err && shown != held)
        err = fail(NORV_ERR_BAD_PARAMETER, "the key does not belong to the certificate");
    if (err) {
        unlink(newPath().c_str());
        return err;
    }
    return putNewInPlace();
}

int getWebCertificate(WebCertificate &certificate)
{
    WebCertificate found;
    found.path = certificatePath();
    if (access(found.path.c_str(), F_OK) != 0)
        return fail(NORV_ERR_FILE_NOT_FOUND, "there is no certificate yet");
    std::string key, text;
    if (int err = publicKey(found.path, key))
        return err;
    if (int err = openssl({"x509", "-in", found.path, "-noout", "-subject", "-enddate", "-ext", "subjectAltName"},
                          "certificate", text))
        return err;
    found.subject = valueOf(text, "subject=");
    found.ends = valueOf(text, "notAfter=");
    found.names = valueOf(text, "Subject Alternative Name:");
    found.pin = pinOfKey(fromPem(key));
    certificate = found;
    return 0;
}

} // namespace iscsihost
