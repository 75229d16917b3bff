/// iscsi-host: the administrator's tool of the host platform.
#include "AccountVerbs.h"
#include "iscsihost/host.h"
#include "NodeVerbs.h"
#include "Output.h"
#include "WebVerbs.h"

#include <CLI/CLI.hpp>
#include <cstdio>
#include <json/json.h>

namespace {

enum {
    exit_ok = 0,
    exit_failed = 1,
    exit_usage = 2,
};

std::string sizeText(uint64_t bytes)
{
    static const char *const units[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB", "EiB"};
    double value = static_cast<double>(bytes);
    size_t unit = 0;
    for (; value >= 1024 && unit + 1 < sizeof units / sizeof *units; ++unit)
        value /= 1024;
    char text[32];
    snprintf(text, sizeof text, unit ? "%.1f %s" : "%.0f %s", value, units[unit]);
    return text;
}

const char *stateText(const iscsihost::Volume &volume)
{
    return !volume.mounted ? "not mounted" : volume.read_only ? "read-only" : "ready";
}

Json::Value toJson(const iscsihost::Volume &volume)
{
    Json::Value json;
    json["path"] = volume.path;
    json["image"] = volume.image;
    json["mounted"] = volume.mounted;
    json["read_only"] = volume.read_only;
    json["size_bytes"] = Json::UInt64(volume.size_bytes);
    json["free_bytes"] = Json::UInt64(volume.free_bytes);
    json["luns"] = volume.luns;
    return json;
}

Json::Value toJson(const std::vector<iscsihost::Volume> &volumes)
{
    Json::Value json(Json::arrayValue);
    for (const iscsihost::Volume &volume : volumes)
        json.append(toJson(volume));
    return json;
}

void printVolumes(const std::vector<iscsihost::Volume> &volumes)
{
    int width = 6;
    for (const iscsihost::Volume &volume : volumes)
        width = std::max(width, static_cast<int>(volume.path.size()));
    printf("%-*s  %-11s  %10s  %10s  %4s\n", width, "VOLUME", "STATE", "SIZE", "FREE", "LUNS");
    for (const iscsihost::Volume &volume : volumes)
        printf("%-*s  %-11s  %10s  %10s  %4d\n", width, volume.path.c_str(), stateText(volume),
               sizeText(volume.size_bytes).c_str(), sizeText(volume.free_bytes).c_str(), volume.luns);
}

int addVolume(const std::string &folder)
{
    if (int err = iscsihost::addVolume(folder))
        return check("volume add", err);
    return exit_ok;
}

int createVolume(const std::string &folder, uint64_t size, const std::string &image)
{
    if (int err = iscsihost::createVolume(folder, size, image))
        return check("volume create", err);
    return exit_ok;
}

int listVolumes(bool as_json)
{
    std::vector<iscsihost::Volume> volumes;
    if (int err = iscsihost::listVolumes(volumes))
        return check("volume list", err);
    if (as_json)
        printJson(toJson(volumes));
    else
        printVolumes(volumes);
    return exit_ok;
}

int removeVolume(const std::string &folder)
{
    std::string kept_image;
    if (int err = iscsihost::removeVolume(folder, kept_image))
        return check("volume remove", err);
    if (!kept_image.empty())
        printf("its image file stays: %s\n", kept_image.c_str());
    return exit_ok;
}

void printReport(const iscsihost::SweepReport &report)
{
    for (const std::string &path : report.removed)
        printf("removed, belonged to no LUN: %s\n", path.c_str());
    for (const std::string &path : report.mended)
        printf("renamed back: %s\n", path.c_str());
    for (const std::string &path : report.foreign)
        printf("left alone, LUN file of another system: %s\n", path.c_str());
    for (const std::string &reason : report.failed)
        fprintf(stderr, "iscsi-host: %s\n", reason.c_str());
    fflush(stdout);
}

int init()
{
    std::string node_uuid;
    if (int err = iscsihost::init(node_uuid))
        return check("init", err);
    printf("node %s\n", node_uuid.c_str());
    return exit_ok;
}

int boot()
{
    iscsihost::SweepReport report;
    const int err = iscsihost::boot(report);
    printReport(report);
    if (err) {
        fprintf(stderr, "iscsi-host: boot: error %d; what could be started is running\n", err);
        return exit_failed;
    }
    return report.failed.empty() ? exit_ok : exit_failed;
}

int run()
{
    // Supervision also brings up what boot could not.
    boot();
    if (int err = iscsihost::supervise())
        return check("run", err);
    return exit_ok;
}

int stop()
{
    if (int err = iscsihost::stop())
        return check("stop", err);
    return exit_ok;
}

int setPortal(const std::vector<std::string> &addresses)
{
    std::string joined;
    for (const std::string &address : addresses)
        joined += (joined.empty() ? "" : " ") + address;
    if (int err = iscsihost::setPortal(joined))
        return check("portal set", err);
    return exit_ok;
}

int showStatus(bool as_json)
{
    iscsihost::Status status;
    if (int err = iscsihost::status(status))
        return check("status", err);
    if (as_json) {
        Json::Value json;
        json["service_alive"] = status.service_alive;
        json["portal"] = status.portal;
        json["tls_port"] = status.tls_port;
        json["tls_problem"] = status.tls_problem;
        json["luns"] = status.luns;
        json["targets"] = status.targets;
        json["volumes"] = toJson(status.volumes);
        json["unhealthy"] = Json::Value(Json::arrayValue);
        for (const iscsihost::UnhealthyLun &lun : status.unhealthy) {
            Json::Value entry;
            entry["lun_id"] = lun.lid;
            entry["name"] = lun.name;
            entry["reason"] = lun.reason;
            json["unhealthy"].append(entry);
        }
        printJson(json);
    } else {
        printf("iSCSI service: %s\n", status.service_alive ? "running" : "not running (iscsi-host boot starts it)");
        printf("portal:        %s\n", status.portal.c_str());
        printf("TLS:           %s\n", status.tls_port
                                          ? ("port " + std::to_string(status.tls_port)).c_str()
                                          : ("no encrypted sendings to here: " + status.tls_problem).c_str());
        printf("LUNs:          %d, %zu unhealthy\n", status.luns, status.unhealthy.size());
        printf("targets:       %d\n\n", status.targets);
        printVolumes(status.volumes);
        for (const iscsihost::UnhealthyLun &lun : status.unhealthy)
            printf("\nunhealthy LUN %d (%s): %s\n", lun.lid, lun.name.c_str(), lun.reason.c_str());
    }
    return exit_ok;
}

int runDue()
{
    std::vector<iscsihost::ScheduleRun> runs;
    const int err = iscsihost::runDueSchedules(runs);
    for (const iscsihost::ScheduleRun &run : runs) {
        if (run.code)
            fprintf(stderr, "iscsi-host: snapshot of LUN %d (%s) failed: error %d: %s\n", run.schedule.lid,
                    run.schedule.lun_name.c_str(), run.code, run.reason.c_str());
        else
            printf("snapshot of LUN %d (%s) taken\n", run.schedule.lid, run.schedule.lun_name.c_str());
    }
    if (err && runs.empty())
        return check("schedule run-due", err);
    return err ? exit_failed : exit_ok;
}

int runTool(int argc, char **argv)
{
    CLI::App app("Volumes and the iSCSI service of this machine.", "iscsi-host");
    app.require_subcommand(1);
    app.footer("State: $ISCSI_HOST_STATE (/var/lib/iscsi-host). Sockets and locks: $ISCSI_HOST_RUN (/run/iscsi-host).\n"
               "Exit status: 0 done, 1 failed, 2 wrong usage.");

    int status = exit_ok;
    std::string folder, image;
    std::vector<std::string> addresses;
    uint64_t size = 0;
    bool as_json = false;

    CLI::App *volume = app.add_subcommand("volume", "Folders that LUNs may live in");
    volume->require_subcommand(1);
    CLI::App *add = volume->add_subcommand("add", "Register a folder on a mounted file system");
    add->add_option("DIR", folder, "The folder")->required();
    add->callback([&] { status = addVolume(folder); });
    CLI::App *create = volume->add_subcommand("create", "Make an image file with an XFS and mount it (root)");
    create->add_option("DIR", folder, "Where to mount it")->required();
    create->add_option("--size", size, "Size, such as 10G; 300M or more; space is taken as it is used")
        ->required()
        ->transform(CLI::AsSizeValue(false));
    create->add_option("--file", image, "The image file to make (default: below the state folder)");
    create->callback([&] { status = createVolume(folder, size, image); });
    CLI::App *list = volume->add_subcommand("list", "Show the volumes");
    list->add_flag("--json", as_json, "For programs");
    list->callback([&] { status = listVolumes(as_json); });
    CLI::App *remove = volume->add_subcommand("remove", "Forget a volume that no LUN lives on");
    remove->add_option("DIR", folder, "The volume")->required();
    remove->callback([&] { status = removeVolume(folder); });

    app.add_subcommand("init", "Make the state and the identity by which other appliances know this one")
        ->callback([&] { status = init(); });
    app.add_subcommand("boot", "Mount the volumes, clean up, start the iSCSI service (root)")->callback([&] {
        status = boot();
    });
    app.add_subcommand("run", "As boot, then stay and restart daemons that die; for a service manager")->callback([&] {
        status = run();
    });
    app.add_subcommand("stop", "Stop the iSCSI service")->callback([&] { status = stop(); });
    CLI::App *show = app.add_subcommand("status", "Show the service, volumes and LUNs that need attention");
    show->add_flag("--json", as_json, "For programs");
    show->callback([&] { status = showStatus(as_json); });

    CLI::App *portal = app.add_subcommand("portal", "The addresses that initiators connect to");
    portal->require_subcommand(1);
    CLI::App *set = portal->add_subcommand("set", "Set them; 'all' for every address of the machine");
    set->add_option("ADDR", addresses, "IPv4 or IPv6 addresses, or 'all'; they take effect when the service starts")
        ->required();
    set->callback([&] { status = setPortal(addresses); });

    CLI::App *schedule = app.add_subcommand("schedule", "Jobs of LUNs; 'iscsictl schedule' shows and changes them");
    schedule->require_subcommand(1);
    schedule->add_subcommand("run-due", "Run what is due; the system's timer calls this each minute")->callback([&] {
        status = runDue();
    });

    addWebVerbs(app, status);
    addAccountVerbs(app, status);
    addNodeVerbs(app, status);

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError &error) {
        return app.exit(error) == 0 ? exit_ok : exit_usage;
    }
    return status;
}

} // namespace

int main(int argc, char **argv)
{
    try {
        return runTool(argc, argv);
    } catch (const std::exception &error) {
        fprintf(stderr, "iscsi-host: %s\n", error.what());
        return exit_failed;
    }
}
