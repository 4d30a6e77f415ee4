// tarvo-ctl: drives a running tarvo-runtime from the command line through the
// local-socket transport: lists projects, variables and containers, sets
// values and statuses, switches projects, injects faults and fires raw bulk
// change events.
#include "automation/dispatch_call.h"
#include "automation/local_socket.h"
#include "platform/text.h"
#include "tarvo/RemoteControl.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

namespace {

const char kHelp[] =
    "usage: tarvo-ctl [--socket-dir DIR] COMMAND ...\n"
    "  projects                          list the projects\n"
    "  variables PROJECT                 list a project's variables (id and name)\n"
    "  containers PROJECT                list a project's containers\n"
    "  set PROJECT VARIABLE VALUE        set a value (a number when it reads as one)\n"
    "  set-text PROJECT VARIABLE TEXT    set a text value\n"
    "  status PROJECT VARIABLE STATUS    set the 64-bit status (decimal or 0x hexadecimal)\n"
    "  activate PROJECT | deactivate PROJECT\n"
    "  fault raise OBJECT DISPID on|off  OBJECT: application projects project variables\n"
    "                                    variable containers container\n"
    "  fault refuse VARIABLE on|off      containers refuse to add the variable\n"
    "  fault start|advise|lookup on|off  container starts, advises, project lookups fail\n"
    "  fault clear\n"
    "  bulk PROJECT CONTAINER ID=VALUE... fire a raw \"VariableBulkChange\" ('' = every container)\n"
    "The socket folder defaults as for tarvo-runtime.\n";

using Args = std::vector<std::string>;

int Fail(const std::string& text) {
    std::fprintf(stderr, "tarvo-ctl: %s\n", text.c_str());
    return 1;
}

int Usage() {
    std::fputs(kHelp, stderr);
    return 2;
}

std::u16string U16(const std::string& text) { return Utf8ToUtf16(text); }
std::string U8(const VARIANT& v) { return v.vt == VT_BSTR && v.bstrVal ? Utf16ToUtf8(v.bstrVal) : std::string(); }

bool ParseNumber(const std::string& text, double* number) {
    if (text.empty()) return false;
    char* end = nullptr;
    errno = 0;
    *number = std::strtod(text.c_str(), &end);
    return errno == 0 && *end == 0;
}

bool ParseStatus(const std::string& text, ULONGLONG* status) {
    if (text.empty() || text[0] == '-') return false;
    char* end = nullptr;
    errno = 0;
    *status = std::strtoull(text.c_str(), &end, 0);
    return errno == 0 && *end == 0;
}

bool ParseSwitch(const std::string& text, bool* on) {
    if (text == "on") *on = true;
    else if (text == "off") *on = false;
    else return false;
    return true;
}

// Now as an OLE DATE in local time.
DATE Now() {
    const std::time_t now = std::time(nullptr);
    std::tm local{};
    localtime_r(&now, &local);
    return 25569.0 + static_cast<double>(now + local.tm_gmtoff) / 86400.0;
}

CComPtr<IDispatch> Application() {
    CComPtr<IUnknown> unknown;
    CComPtr<IDispatch> application;
    if (SUCCEEDED(GetActiveObject(CLSID_TarvoApplication, unknown.Receive())))
        unknown.QueryInterface(IID_ITarvoApplication, application);
    return application;
}

// Lists the items of a collection (projects or variables): "id name" or "name".
int List(IDispatch* collection, bool withIds) {
    using namespace tarvo::dispid;
    const CComVariant count = GetPropertyOrThrow(collection, CollectionCount);
    for (LONG i = 0; count.vt == VT_I4 && i < count.lVal; ++i) {
        const CComVariant item = CallMethodOrThrow(collection, CollectionItem, static_cast<int>(i));
        if (item.vt != VT_DISPATCH || !item.pdispVal) continue;
        if (withIds) {
            const CComVariant id = GetPropertyOrThrow(item.pdispVal, VariableId);
            const CComVariant name = GetPropertyOrThrow(item.pdispVal, VariableName);
            std::printf("%d %s\n", id.vt == VT_I4 ? id.lVal : 0, U8(name).c_str());
        } else {
            std::printf("%s\n", U8(GetPropertyOrThrow(item.pdispVal, ProjectName)).c_str());
        }
    }
    return 0;
}

int Browse(const Args& args) {
    using namespace tarvo::dispid;
    CComPtr<IDispatch> application = Application();
    if (!application) return Fail("no runtime is running");
    try {
        const CComVariant projects = CallMethodOrThrow(application.Get(), ApplicationProjects);
        if (args[0] == "projects") return List(projects.pdispVal, false);
        const CComVariant project = CallMethodOrThrow(projects.pdispVal, CollectionItem, U16(args[1]));
        if (project.vt != VT_DISPATCH || !project.pdispVal) return Fail("no project " + args[1]);
        const CComVariant variables = CallMethodOrThrow(project.pdispVal, ProjectVariables);
        return List(variables.pdispVal, true);
    } catch (const CAutomationError& error) {
        return Fail(error.what());
    }
}

int Containers(tarvo::RemoteControl& control, const std::string& project) {
    const auto list = control.Containers(U16(project));
    if (FAILED(control.LastStatus())) return Fail("the runtime did not answer");
    for (const auto& info : list) {
        std::printf("%s %s, %zu sinks:", Utf16ToUtf8(info.name).c_str(), info.started ? "started" : "stopped",
                    info.sinks);
        for (const auto& name : info.variables) std::printf(" %s", Utf16ToUtf8(name).c_str());
        std::printf("\n");
    }
    return 0;
}

int Fault(tarvo::RemoteControl& control, const Args& args) {
    static const char* const kObjects[] = {"application", "projects",   "project",  "variables",
                                           "variable",    "containers", "container"};
    bool on = false;
    bool ok = false;
    if (args.size() == 2 && args[1] == "clear") {
        ok = control.ClearFaults();
    } else if (args.size() == 5 && args[1] == "raise" && ParseSwitch(args[4], &on)) {
        int kind = -1;
        for (int i = 0; i < 7; ++i) {
            if (args[2] == kObjects[i]) kind = i;
        }
        double member = 0;
        if (kind < 0 || !ParseNumber(args[3], &member)) return Usage();
        ok = control.SetRaiseError(static_cast<tarvo::ObjectKind>(kind), static_cast<DISPID>(member), on);
    } else if (args.size() == 4 && args[1] == "refuse" && ParseSwitch(args[3], &on)) {
        ok = control.SetRefusedName(U16(args[2]), on);
    } else if (args.size() == 3 && ParseSwitch(args[2], &on)) {
        if (args[1] == "start") ok = control.SetStartFails(on);
        else if (args[1] == "advise") ok = control.SetAdviseFails(on);
        else if (args[1] == "lookup") ok = control.SetProjectLookupFails(on);
        else return Usage();
    } else {
        return Usage();
    }
    return ok ? 0 : Fail("the runtime did not answer");
}

CComVariant NumberArray(const std::vector<double>& numbers) {
    CComVariant array;
    array.vt = VT_ARRAY | VT_R8;
    array.parray = SafeArrayCreateVector(VT_R8, 0, static_cast<std::uint32_t>(numbers.size()));
    if (array.parray && !numbers.empty())
        std::memcpy(array.parray->pvData, numbers.data(), numbers.size() * sizeof(double));
    return array;
}

int Bulk(tarvo::RemoteControl& control, const Args& args) {
    std::vector<double> ids, zeros, times;
    CComVariant values;
    values.vt = VT_ARRAY | VT_VARIANT;
    values.parray = SafeArrayCreateVector(VT_VARIANT, 0, static_cast<std::uint32_t>(args.size() - 3));
    for (size_t i = 3; i < args.size(); ++i) {
        const size_t at = args[i].find('=');
        double id = 0;
        if (at == std::string::npos || !ParseNumber(args[i].substr(0, at), &id)) return Usage();
        const std::string text = args[i].substr(at + 1);
        double number = 0;
        const CComVariant value = ParseNumber(text, &number) ? CComVariant(number)
                                                             : CComVariant(std::u16string_view(U16(text)));
        const LONG index = static_cast<LONG>(ids.size());
        SafeArrayPutElement(values.parray, &index, &value);
        ids.push_back(id);
        zeros.push_back(0);
        times.push_back(Now());
    }
    const bool fired = control.FireRawBulkChange(U16(args[1]), U16(args[2]),
                                                 {CComVariant(static_cast<int>(ids.size())), NumberArray(ids), values,
                                                  NumberArray(zeros), NumberArray(zeros), NumberArray(times)});
    return fired ? 0 : Fail("no such project or container, or the runtime did not answer");
}

int Run(const Args& args) {
    const std::string& command = args[0];
    if ((command == "projects" && args.size() == 1) || (command == "variables" && args.size() == 2))
        return Browse(args);
    tarvo::RemoteControl control(tarvo::RemoteControl::Find());
    if (command == "containers" && args.size() == 2) return Containers(control, args[1]);
    if ((command == "set" || command == "set-text") && args.size() == 4) {
        double number = 0;
        const bool isNumber = command == "set" && ParseNumber(args[3], &number);
        const CComVariant value = isNumber ? CComVariant(number) : CComVariant(std::u16string_view(U16(args[3])));
        return control.SetValue(U16(args[1]), U16(args[2]), value) ? 0
                                                                   : Fail("no such project or variable, or no runtime");
    }
    if (command == "status" && args.size() == 4) {
        ULONGLONG status = 0;
        if (!ParseStatus(args[3], &status)) return Usage();
        return control.SetStatus(U16(args[1]), U16(args[2]), status)
                   ? 0
                   : Fail("no such project or variable, or no runtime");
    }
    if ((command == "activate" || command == "deactivate") && args.size() == 2)
        return control.SetProjectActive(U16(args[1]), command == "activate") ? 0
                                                                             : Fail("no such project, or no runtime");
    if (command == "fault" && args.size() >= 2) return Fault(control, args);
    if (command == "bulk" && args.size() >= 4) return Bulk(control, args);
    return Usage();
}

}  // namespace

int main(int argc, char** argv) {
    LocalSocketOptions options;
    options.callTimeoutMs = 10000;
    Args args;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--help" || arg == "-h") {
            std::fputs(kHelp, stdout);
            return 0;
        }
        if (arg == "--socket-dir" && args.empty() && i + 1 < argc) options.folder = argv[++i];
        else args.push_back(arg);
    }
    if (args.empty()) return Usage();
    options.log = [](const std::string& text) { std::fprintf(stderr, "tarvo-ctl: %s\n", text.c_str()); };
    const DWORD source = AddRunningObjectSource(CreateLocalSocketSource(options));
    const int result = Run(args);
    RemoveRunningObjectSource(source);
    return result;
}
