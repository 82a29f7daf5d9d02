// index: build, update, show or keep current a volume's file index (root only).
#include <signal.h>
#include <stdio.h>
#include <string.h>
#include <time.h>

#include <iostream>
#include <string>

#include "exit_status.h"
#include "fileidx.h"
#include "handlers.h"
#include "norvo/errors.h"
#include "output.h"
#include "text_safe.h"
#include "vlibc_err.h"

namespace norvo::cli {
namespace {

volatile int g_stop = 0;

void Stop(int) {
    g_stop = 1;
}

int PlatformFailure(const Invocation &inv, const std::string &what) {
    char code[16];
    snprintf(code, sizeof code, "0x%04X", static_cast<unsigned>(VLIBCErrGet()));
    return ReportFailure(inv, NVO_ERR_SYSTEM, what + " failed (platform error " + code + ")");
}

std::string When(long long seconds) {
    return seconds == 0 ? std::string("-") : Date(static_cast<int32_t>(seconds));
}

int Status(const Invocation &inv, const std::string &volume) {
    FI_INDEX_STATUS status;
    if (FILEIDXIndexStatus(volume.c_str(), &status) != 0) {
        return PlatformFailure(inv, "reading the index of " + volume);
    }
    const char *state = status.state == FI_INDEX_READY     ? "ready"
                        : status.state == FI_INDEX_DAMAGED ? "damaged"
                                                           : "none";
    Json::Value data(Json::objectValue);
    data["state"] = state;
    data["busy"] = status.building != 0;
    data["entries"] = Json::UInt64(status.entries);
    data["folders"] = Json::UInt64(status.folders);
    data["bytes"] = Json::UInt64(status.bytes);
    data["built"] = Json::Int64(status.built);
    data["updated"] = Json::Int64(status.updated);
    TextTable text;
    text.Row("state", std::string(state) + (status.building != 0 ? " (being written)" : ""))
        .Row("entries", std::to_string(status.entries))
        .Row("folders", std::to_string(status.folders))
        .Row("bytes", std::to_string(status.bytes))
        .Row("built", When(status.built))
        .Row("updated", When(status.updated));
    return ReportSuccess(inv, data, text);
}

}  // namespace

int RunIndex(const Invocation &inv) {
    const std::string &action = inv.arguments[0];
    const std::string &volume = inv.arguments[1];
    if (action == "status") {
        return Status(inv, volume);
    }
    Json::Value data(Json::objectValue);
    TextTable text;
    if (action == "build") {
        if (FILEIDXIndexBuild(volume.c_str()) != 0) {
            return PlatformFailure(inv, "building the index of " + volume);
        }
        text.Line("built the index of " + TerminalSafe(volume));
    } else if (action == "update") {
        unsigned long long read = 0;
        if (FILEIDXIndexUpdate(volume.c_str(), &read) != 0) {
            return PlatformFailure(inv, "updating the index of " + volume);
        }
        data["folders_read"] = Json::UInt64(read);
        text.Row("folders read", std::to_string(read));
    } else if (action == "watch") {
        struct sigaction onSignal {};
        onSignal.sa_handler = Stop;
        sigaction(SIGINT, &onSignal, nullptr);
        sigaction(SIGTERM, &onSignal, nullptr);
        if (FILEIDXIndexWatch(volume.c_str(), &g_stop) != 0) {
            return PlatformFailure(inv, "watching " + volume);
        }
        text.Line("stopped watching " + TerminalSafe(volume));
    } else {
        return ReportUsageError(inv.command, "unknown action: " + action);
    }
    return ReportSuccess(inv, data, text);
}

}  // namespace norvo::cli
