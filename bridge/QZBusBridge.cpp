// Map: the name checks (NameHasOwner, ListActivatableNames), the object with its two interfaces
// (sd-bus answers Introspect and Properties from the tables below), the font methods that reply
// and then read their resources, and the loop with its signals.
#include "bridge/QZBusBridge.h"

#include <signal.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include <cstring>
#include <memory>
#include <string>

#include "bridge/QZFontAsker.h"
#include "bridge/QZFontResources.h"
#include "platform/Log.h"
#include "platform/LogEscape.h"

namespace {

constexpr char kObjectPath[] = "/org/freedesktop/PackageKit";
constexpr char kModify2[] = "org.freedesktop.PackageKit.Modify2";
constexpr char kModify[] = "org.freedesktop.PackageKit.Modify";
/// Resources read per call; the rest of a longer list are counted and left out.
constexpr size_t kMaximumResources = 256;
/// Resources that cannot be served are logged one by one up to this many per call.
constexpr size_t kLoggedResources = 8;
/// A logged resource shows at most this many bytes.
constexpr size_t kLoggedResourceSize = 128;

/// The asker of the running bridge, for the method handlers.
QZFontAsker* gAsker = nullptr;

std::string Escaped(std::string_view text) {
    return glyphwell::LogEscape(text);
}

/// Reads the resources array at the message's read position into `wants`, logging what cannot
/// be served; false when the message does not hold one.
bool ReadResources(sd_bus_message* message, QZFontResourceWants& wants) {
    if (sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, "s") <= 0)
        return false;
    const char* sender = sd_bus_message_get_sender(message);
    size_t count = 0, unserved = 0;
    const char* resource = nullptr;
    while (sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &resource) > 0) {
        if (++count > kMaximumResources || QZAddFontResource(resource, wants))
            continue;
        if (++unserved <= kLoggedResources) {
            const std::string_view text(resource);
            glyphwell::AppLog("Cannot serve the font resource %s%s from %s",
                              Escaped(text.substr(0, kLoggedResourceSize)).c_str(),
                              text.size() > kLoggedResourceSize ? "..." : "",
                              Escaped(sender ? sender : "").c_str());
        }
    }
    if (unserved > kLoggedResources)
        glyphwell::AppLog("Cannot serve %zu more font resources from %s",
                          unserved - kLoggedResources, Escaped(sender ? sender : "").c_str());
    if (count > kMaximumResources)
        glyphwell::AppLog("Left out %zu font resources beyond the first %zu from %s",
                          count - kMaximumResources, kMaximumResources,
                          Escaped(sender ? sender : "").c_str());
    sd_bus_message_exit_container(message);
    return true;
}

/// Sends the success reply first, then reads the request: callers never wait for the work. The
/// caller's pid is asked of the bus before the reply goes, while the caller is surely connected.
void Serve(sd_bus_message* message, bool hasDesktopID) {
    const char* sender = sd_bus_message_get_sender(message);
    if (gAsker && sender)
        gAsker->Open(sender);
    sd_bus_reply_method_return(message, nullptr);
    if (!hasDesktopID)
        sd_bus_message_skip(message, "u"); // Modify's window id: nothing to place a window on
    QZFontResourceWants wants;
    const char* interaction = nullptr;
    const char* desktopID = "";
    if (!ReadResources(message, wants) ||
        sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &interaction) < 0)
        return;
    if (hasDesktopID)
        sd_bus_message_read_basic(message, SD_BUS_TYPE_STRING, &desktopID);
    if (gAsker && sender)
        gAsker->Add(sender, desktopID ? desktopID : "", wants);
}

int InstallFontconfigResources2(sd_bus_message* message, void*, sd_bus_error*) {
    Serve(message, true);
    return 1;
}

int InstallFontconfigResources(sd_bus_message* message, void*, sd_bus_error*) {
    Serve(message, false);
    return 1;
}

int NotSupported(sd_bus_message* message, void*, sd_bus_error*) {
    return sd_bus_reply_method_errorf(message, SD_BUS_ERROR_NOT_SUPPORTED,
                                      "Glyphwell installs fonts only; %s is not supported",
                                      sd_bus_message_get_member(message));
}

#define MODIFY2_METHOD(name, handler)                                                              \
    SD_BUS_METHOD_WITH_NAMES(name, "asssa{sv}",                                                    \
                             SD_BUS_PARAM(names) SD_BUS_PARAM(interaction)                         \
                                 SD_BUS_PARAM(desktop_id) SD_BUS_PARAM(platform_data),             \
                             "", , handler, 0)
#define MODIFY_METHOD(name, handler)                                                               \
    SD_BUS_METHOD_WITH_NAMES(name, "uass",                                                         \
                             SD_BUS_PARAM(xid) SD_BUS_PARAM(names) SD_BUS_PARAM(interaction), "",  \
                             , handler, 0)

const sd_bus_vtable kModify2Table[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD_WITH_NAMES("InstallFontconfigResources", "asssa{sv}",
                             SD_BUS_PARAM(resources) SD_BUS_PARAM(interaction)
                                 SD_BUS_PARAM(desktop_id) SD_BUS_PARAM(platform_data),
                             "", , InstallFontconfigResources2, 0),
    MODIFY2_METHOD("InstallPackageFiles", NotSupported),
    MODIFY2_METHOD("InstallProvideFiles", NotSupported),
    MODIFY2_METHOD("InstallCatalogs", NotSupported),
    MODIFY2_METHOD("InstallPackageNames", NotSupported),
    MODIFY2_METHOD("InstallMimeTypes", NotSupported),
    MODIFY2_METHOD("InstallGStreamerResources", NotSupported),
    MODIFY2_METHOD("RemovePackageByFiles", NotSupported),
    MODIFY2_METHOD("InstallPrinterDrivers", NotSupported),
    SD_BUS_METHOD_WITH_NAMES("InstallResources", "asasssa{sv}",
                             SD_BUS_PARAM(types) SD_BUS_PARAM(resources) SD_BUS_PARAM(interaction)
                                 SD_BUS_PARAM(desktop_id) SD_BUS_PARAM(platform_data),
                             "", , NotSupported, 0),
    SD_BUS_VTABLE_END};

const sd_bus_vtable kModifyTable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD_WITH_NAMES("InstallFontconfigResources", "uass",
                             SD_BUS_PARAM(xid) SD_BUS_PARAM(resources) SD_BUS_PARAM(interaction),
                             "", , InstallFontconfigResources, 0),
    MODIFY_METHOD("InstallPackageFiles", NotSupported),
    MODIFY_METHOD("InstallProvideFiles", NotSupported),
    MODIFY_METHOD("InstallCatalogs", NotSupported),
    MODIFY_METHOD("InstallPackageNames", NotSupported),
    MODIFY_METHOD("InstallMimeTypes", NotSupported),
    MODIFY_METHOD("InstallGStreamerResources", NotSupported),
    MODIFY_METHOD("RemovePackageByFiles", NotSupported),
    MODIFY_METHOD("InstallPrinterDrivers", NotSupported),
    SD_BUS_METHOD_WITH_NAMES("InstallResources", "uasass",
                             SD_BUS_PARAM(xid) SD_BUS_PARAM(types) SD_BUS_PARAM(resources)
                                 SD_BUS_PARAM(interaction),
                             "", , NotSupported, 0),
    SD_BUS_VTABLE_END};

enum class Provider { Nobody, Owner, ServiceFile, Unknown };

/// Who provides the name already; Unknown, with the bus's message in `*failure`, when the bus
/// cannot say.
Provider OtherProvider(sd_bus* bus, std::string* failure) {
    sd_bus_error error = SD_BUS_ERROR_NULL;
    sd_bus_message* reply = nullptr;
    Provider provider = Provider::Nobody;
    int owned = 0;
    if (sd_bus_call_method(bus, "org.freedesktop.DBus", "/org/freedesktop/DBus",
                           "org.freedesktop.DBus", "NameHasOwner", &error, &reply, "s",
                           kQZFontInstallBusName) < 0 ||
        sd_bus_message_read(reply, "b", &owned) < 0) {
        provider = Provider::Unknown;
        *failure = error.message ? error.message : "NameHasOwner failed";
    } else if (owned) {
        provider = Provider::Owner;
    } else {
        reply = sd_bus_message_unref(reply);
        char** names = nullptr;
        if (sd_bus_call_method(bus, "org.freedesktop.DBus", "/org/freedesktop/DBus",
                               "org.freedesktop.DBus", "ListActivatableNames", &error, &reply,
                               "") < 0 ||
            sd_bus_message_read_strv(reply, &names) < 0) {
            provider = Provider::Unknown;
            *failure = error.message ? error.message : "ListActivatableNames failed";
        } else {
            for (char** name = names; name && *name; ++name)
                if (std::strcmp(*name, kQZFontInstallBusName) == 0)
                    provider = Provider::ServiceFile;
        }
        for (char** name = names; name && *name; ++name)
            free(*name);
        free(names);
    }
    sd_bus_message_unref(reply);
    sd_bus_error_free(&error);
    return provider;
}

int OnNameLost(sd_bus_message* message, void*, sd_bus_error*) {
    const char* name = nullptr;
    if (sd_bus_message_read(message, "s", &name) > 0 &&
        std::strcmp(name, kQZFontInstallBusName) == 0) {
        glyphwell::AppLog("Another provider took %s over; ending", kQZFontInstallBusName);
        sd_event_exit(sd_bus_get_event(sd_bus_message_get_bus(message)), 0);
    }
    return 0;
}

int OnStopSignal(sd_event_source* source, const struct signalfd_siginfo*, void* bus) {
    sd_bus_release_name(static_cast<sd_bus*>(bus), kQZFontInstallBusName);
    sd_bus_flush(static_cast<sd_bus*>(bus));
    return sd_event_exit(sd_event_source_get_event(source), 0);
}

struct BusDeleter {
    void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};
struct EventDeleter {
    void operator()(sd_event* event) const { sd_event_unref(event); }
};

} // namespace

int QZRunBusBridge() {
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    // SIGCHLD too: the loop watches the font-choice workers.
    sigaddset(&stopSignals, SIGCHLD);
    sigprocmask(SIG_BLOCK, &stopSignals, nullptr);

    sd_event* eventPointer = nullptr;
    sd_bus* busPointer = nullptr;
    if (sd_event_new(&eventPointer) < 0)
        return 1;
    std::unique_ptr<sd_event, EventDeleter> event(eventPointer);
    if (const int error = sd_bus_open_user(&busPointer); error < 0) {
        glyphwell::AppLog("Cannot connect to the session bus: %s", std::strerror(-error));
        return 1;
    }
    std::unique_ptr<sd_bus, BusDeleter> bus(busPointer);

    std::string failure;
    const Provider provider = OtherProvider(bus.get(), &failure);
    if (provider == Provider::Unknown) {
        glyphwell::AppLog("Cannot ask the session bus who provides %s: %s", kQZFontInstallBusName,
                          Escaped(failure).c_str());
        return 1;
    }
    if (provider != Provider::Nobody) {
        glyphwell::AppLog(provider == Provider::Owner
                              ? "%s is owned by another connection; leaving it to that provider"
                              : "%s is provided by a D-Bus service file; leaving it to that "
                                "provider",
                          kQZFontInstallBusName);
        return 0;
    }

    QZFontAsker asker(event.get(), bus.get(), nullptr);
    gAsker = &asker;
    struct AskerReset {
        ~AskerReset() { gAsker = nullptr; }
    } askerReset;
    if (sd_bus_add_object_vtable(bus.get(), nullptr, kObjectPath, kModify2, kModify2Table,
                                 nullptr) < 0 ||
        sd_bus_add_object_vtable(bus.get(), nullptr, kObjectPath, kModify, kModifyTable, nullptr) <
            0 ||
        sd_bus_match_signal(bus.get(), nullptr, "org.freedesktop.DBus", "/org/freedesktop/DBus",
                            "org.freedesktop.DBus", "NameLost", OnNameLost, nullptr) < 0 ||
        sd_bus_attach_event(bus.get(), event.get(), SD_EVENT_PRIORITY_NORMAL) < 0 ||
        sd_bus_set_exit_on_disconnect(bus.get(), 1) < 0 ||
        sd_event_add_signal(event.get(), nullptr, SIGTERM, OnStopSignal, bus.get()) < 0 ||
        sd_event_add_signal(event.get(), nullptr, SIGINT, OnStopSignal, bus.get()) < 0) {
        glyphwell::AppLog("Cannot set up the font-install service on the session bus");
        return 1;
    }
    // Without SD_BUS_NAME_QUEUE the request does not queue; nor does it replace an owner that
    // appeared since the check. A provider asking to replace the bridge may.
    if (const int error =
            sd_bus_request_name(bus.get(), kQZFontInstallBusName, SD_BUS_NAME_ALLOW_REPLACEMENT);
        error < 0) {
        if (error == -EEXIST) {
            glyphwell::AppLog("%s is owned by another connection; leaving it to that provider",
                              kQZFontInstallBusName);
            return 0;
        }
        glyphwell::AppLog("Cannot own %s: %s", kQZFontInstallBusName, std::strerror(-error));
        return 1;
    }
    const int status = sd_event_loop(event.get());
    return status < 0 ? 1 : 0;
}
