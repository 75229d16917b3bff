#include "WebVerbs.h"

#include "iscsihost/web.h"
#include "Output.h"

#include <cstdio>
#include <memory>

namespace {

int setListener(const iscsihost::WebListener &wish)
{
    iscsihost::WebListener listener;
    if (int err = iscsihost::getWebListener(listener))
        return check("web set", err);
    if (!wish.address.empty())
        listener.address = wish.address;
    if (wish.port != 0)
        listener.port = wish.port;
    return check("web set", iscsihost::setWebListener(listener));
}

int showListener()
{
    iscsihost::WebListener listener;
    if (int err = iscsihost::getWebListener(listener))
        return check("web show", err);
    printf("address  %s\nport     %u\n", listener.address.c_str(), listener.port);
    return 0;
}

int showCertificate()
{
    iscsihost::WebCertificate certificate;
    if (int err = iscsihost::getWebCertificate(certificate))
        return check("certificate show", err);
    printf("file         %s\nsubject      %s\nnames        %s\nvalid until  %s\nfingerprint  %s\n",
           certificate.path.c_str(), certificate.subject.c_str(), certificate.names.c_str(), certificate.ends.c_str(),
           certificate.pin.c_str());
    return 0;
}

/// Shows what a change led to: peers need the new fingerprint.
int changed(const char *what, int code)
{
    const int failed = check(what, code);
    return failed ? failed : showCertificate();
}

} // namespace

void addWebVerbs(CLI::App &app, int &status)
{
    struct Words {
        iscsihost::WebListener listener{"", 0};
        std::string certificate, key;
    };
    const auto words = std::make_shared<Words>();

    CLI::App *web = app.add_subcommand("web", "The web server of the web API");
    web->require_subcommand(1);
    CLI::App *set = web->add_subcommand("set", "Set where it listens; takes effect when it starts");
    set->add_option("--address", words->listener.address, "An IP address, or 'all'");
    set->add_option("--port", words->listener.port, "TCP port")->check(CLI::Range(1, 65535));
    set->require_option(1, 2);
    set->callback([=, &status] { status = setListener(words->listener); });
    web->add_subcommand("show", "Show where it listens")->callback([&status] { status = showListener(); });
    web->add_subcommand("run", "Run it in the foreground; for a service manager (root)")->callback([&status] {
        status = check("web run", iscsihost::runWebServer());
    });

    CLI::App *certificate = app.add_subcommand("certificate", "What the web server shows of itself");
    certificate->require_subcommand(1);
    certificate->add_subcommand("show", "Show it, with the fingerprint that a joining peer compares")
        ->callback([&status] { status = showCertificate(); });
    certificate
        ->add_subcommand("make", "Make a new key and certificate, signed by itself; peers refuse it until they have "
                                 "its fingerprint. Takes effect when the web server starts")
        ->callback([&status] { status = changed("certificate make", iscsihost::makeWebCertificate()); });
    CLI::App *take = certificate->add_subcommand("set", "Take a certificate; takes effect when the web server starts");
    take->add_option("CERTIFICATE", words->certificate, "PEM file: the certificate, behind it those that signed it")
        ->required();
    take->add_option("KEY", words->key, "PEM file: its private key, without a passphrase")->required();
    take->callback([=, &status] {
        status = changed("certificate set", iscsihost::setWebCertificate(words->certificate, words->key));
    });
}
