// corvpkg version-compare, deps and order: the dependency engine from the command line.
#include <stdio.h>
#include <string.h>

#include <string>

#include "cli.h"
#include "corvpkg/corvpkg.h"
#include "corvpkg/pkglint.h"

namespace cli {

using namespace CORVPackageTool;

namespace {

PKG_VERSION_COMPOP parseOperator(const std::string& text, bool& ok) {
    static const struct {
        const char* text;
        PKG_VERSION_COMPOP op;
    } kOps[] = {{"=", PKG_COMPOP_EQ},  {"==", PKG_COMPOP_EQ}, {">", PKG_COMPOP_GT},
                {"<", PKG_COMPOP_LT},  {">=", PKG_COMPOP_GE}, {"<=", PKG_COMPOP_LE},
                {"eq", PKG_COMPOP_EQ}, {"gt", PKG_COMPOP_GT}, {"lt", PKG_COMPOP_LT},
                {"ge", PKG_COMPOP_GE}, {"le", PKG_COMPOP_LE}};
    for (const auto& entry : kOps) {
        if (text == entry.text) {
            ok = true;
            return entry.op;
        }
    }
    ok = false;
    return PKG_COMPOP_NONE;
}

Json::Value strings(const std::vector<std::string>& items) {
    Json::Value out(Json::arrayValue);
    for (const std::string& item : items) {
        out.append(item);
    }
    return out;
}

std::string joined(const std::vector<std::string>& items, const char* separator) {
    std::string out;
    for (const std::string& item : items) {
        out += (out.empty() ? "" : separator) + item;
    }
    return out;
}

}  // namespace

int cmdVersionCompare(const std::vector<std::string>& given) {
    const Command& self = findCommand("version-compare");
    // Versions and operators never begin with "--": the common options may stand anywhere.
    std::vector<std::string> args;
    for (const std::string& arg : given) {
        if (arg != "--json" && arg != "--quiet" && arg != "-q" && arg != "--verbose" &&
            arg != "-v") {
            args.push_back(arg);
        }
    }
    if (args.size() != 3) {
        return usageError(self, "give a version, an operator and a version");
    }
    bool ok = false;
    PKG_VERSION_COMPOP op = parseOperator(args[1], ok);
    if (!ok) {
        return usageError(self, "unknown operator " + args[1]);
    }
    // The comparison reads any text, a word as 0: "abc" < "1.0" would hold.
    for (const std::string& version : {args[0], args[2]}) {
        if (!PMSIsVersionText(version)) {
            return usageError(self, "\"" + version +
                                        "\" is not a version (dotted numbers with an optional "
                                        "-build, e.g. 1.2.3-0045)");
        }
    }
    // The relation of the first version to the second.
    PackageBasicInfo a("v", args[0]);
    PackageBasicInfo b("v", args[2]);
    return a.compare(b, op) ? EXIT_OK : EXIT_FAILED;
}

int cmdDeps(const std::vector<std::string>& args) {
    CommonOptions opts;
    if (int status = parseSingle(args, "deps", "package name", opts); status >= 0) {
        return status;
    }
    const std::string& name = opts.positional[0];
    PackageManager pm;
    PackageInfo info;
    if (!pm.getPackageInfo(name, info, opts.lang.empty() ? nullptr : opts.lang.c_str(),
                           PKG_INFO_MASK_ALL)) {
        return printFailure(opts.json, pm.getResult(), name + " is not installed");
    }
    Json::Value needs;
    info.dep_packages.toJSON(needs);
    Json::Value conflicts;
    info.conflict_packages.toJSON(conflicts);
    std::vector<std::string> dependents;
    pm.arePackagesDepended(name, nullptr, dependents);
    std::vector<std::string> stopOrder;
    bool ordered = pm.getDependencyOrder(name.c_str(), stopOrder, false);

    if (opts.json) {
        Json::Value out(Json::objectValue);
        out["package"] = name;
        out["needs"] = needs.isNull() ? Json::Value(Json::objectValue) : needs;
        out["conflicts"] = conflicts.isNull() ? Json::Value(Json::objectValue) : conflicts;
        out["needed_by"] = strings(dependents);
        out["stop_order"] = strings(stopOrder);
        out["stop_order_ok"] = ordered;
        printf("%s\n", toString(out).c_str());
    } else {
        std::string needText;
        for (const PackageBasicInfo& dep : info.dep_packages) {
            std::string bound =
                dep.compop == PKG_COMPOP_NONE
                    ? dep.package
                    : dep.package + " " + PMSCompOpToStr(dep.compop) + " " + dep.version;
            needText += (needText.empty() ? "" : ", ") + bound;
        }
        printf("%-12s %s\n", "needs:", needText.empty() ? "(nothing)" : needText.c_str());
        printf("%-12s %s\n",
               "needed by:", dependents.empty() ? "(nobody)" : joined(dependents, ", ").c_str());
        printf("%-12s %s%s\n", "stop order:", joined(stopOrder, " -> ").c_str(),
               ordered ? "" : " (dependency cycle)");
    }
    return ordered ? EXIT_OK : EXIT_FAILED;
}

int cmdOrder(const std::vector<std::string>& args) {
    const Command& self = findCommand("order");
    CommonOptions opts;
    if (!parseCommon(args, self, opts)) {
        return EXIT_USAGE;
    }
    if (!opts.positional.empty()) {
        return usageError(self, "unexpected argument " + opts.positional[0]);
    }
    PackageManager pm;
    LogCapture log;
    std::vector<std::string> order;
    if (!pm.getDependencyOrder(order)) {
        return printFailure(opts.json, PKG_ERR_DEPENDENCY_CYCLE, log.reasons());
    }
    // Installing goes from the dependencies to their dependents: the order read backwards.
    std::vector<std::string> install(order.rbegin(), order.rend());
    if (opts.json) {
        printf("%s\n", toString(strings(install)).c_str());
    } else {
        for (const std::string& name : install) {
            printf("%s\n", name.c_str());
        }
    }
    return EXIT_OK;
}

}  // namespace cli
