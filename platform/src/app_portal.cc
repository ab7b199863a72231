// Rendering of the packages' portals for the system web server.
#include "app_portal.h"

#include <json/json.h>
#include <kainjow/mustache.hpp>

#include <fstream>
#include <set>
#include <sstream>
#include <string>

#include "corv/certificate.h"
#include "corv/csp_rule.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corv/web.h"
#include "json_store.h"
#include "sz_holder.h"

namespace corvw3 {

namespace {

using Mustache = kainjow::mustache::mustache;
using MustacheData = kainjow::mustache::data;

bool IsPathSegment(const std::string& text) {
    if (text.empty() || text == "." || text == "..") {
        return false;
    }
    for (char c : text) {
        const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                           (c >= '0' && c <= '9') || c == '.' || c == '_' || c == '-';
        if (!plain) {
            return false;
        }
    }
    return true;
}

// What {{name}} may insert into an nginx directive.
std::string KeepDirectiveSafe(const std::string& value) {
    std::string out;
    for (char c : value) {
        const bool safe = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                          (c >= '0' && c <= '9') ||
                          std::string("._-/:@+=").find(c) != std::string::npos;
        if (safe) {
            out += c;
        }
    }
    return out;
}

void Overlay(const Json::Value& object, MustacheData& data) {
    if (!object.isObject()) {
        return;
    }
    for (const std::string& key : object.getMemberNames()) {
        const Json::Value& value = object[key];
        if (value.isString() || value.isNumeric()) {
            data.set(key, value.asString());
        } else if (value.isBool()) {
            data.set(key, value.asBool() ? MustacheData::type::bool_true
                                         : MustacheData::type::bool_false);
        }
    }
}

std::string ReadText(const std::string& path, bool& ok) {
    std::ifstream in(path);
    std::stringstream buffer;
    buffer << in.rdbuf();
    ok = static_cast<bool>(in) || in.eof();
    return buffer.str();
}

std::string Indented(const std::string& text, const std::string& indent) {
    std::string out;
    std::istringstream lines(text);
    for (std::string line; std::getline(lines, line);) {
        out += line.empty() ? "\n" : indent + line + "\n";
    }
    return out;
}

// One package's location block, or "" when it is left out.
std::string RenderPortal(const std::string& pkg, std::set<std::string>& aliases) {
    const std::string base = std::string(AppPortalDir()) + "/" + pkg;
    Json::Value fragment;
    if (corvplat::readJsonFile(base + ".json", fragment) != corvplat::JsonRead::kOk ||
        !fragment.isObject()) {
        CORV_LOG_ERR("Portal of %s left out: no JSON object in %s.json", pkg.c_str(), base.c_str());
        return "";
    }
    Json::Value user;
    corvplat::readJsonFile("/usr/corv/etc/packages/" + pkg + "/AppPortal.json", user);
    MustacheData data;
    Overlay(fragment, data);
    Overlay(user, data);
    std::string alias = pkg;
    for (const Json::Value* source : {&fragment, &user}) {
        if (source->isObject() && (*source)["alias"].isString()) {
            alias = (*source)["alias"].asString();
        }
    }
    if (!IsPathSegment(alias) || !aliases.insert(alias).second) {
        CORV_LOG_ERR("Portal of %s left out: alias [%s] is no path segment or taken", pkg.c_str(),
                     alias.c_str());
        return "";
    }
    data.set("pkg", pkg);
    data.set("alias", alias);
    data.set("target", "/var/packages/" + pkg + "/target");
    bool read = false;
    Mustache tmpl(ReadText(base + ".mustache", read));
    tmpl.set_custom_escape(KeepDirectiveSafe);
    const std::string rendered = read && tmpl.is_valid() ? tmpl.render(data) : std::string();
    if (!read || !tmpl.is_valid() || !tmpl.error_message().empty()) {
        CORV_LOG_ERR("Portal of %s left out: template %s.mustache: %s", pkg.c_str(), base.c_str(),
                     tmpl.error_message().c_str());
        return "";
    }
    std::string block = "    # " + pkg + ": " + base + ".mustache\n";
    block += "    location /" + alias + "/ {\n";
    const std::string csp = CORV::NOS::CspRule::HeaderOf(pkg);
    if (!csp.empty()) {
        block += "        add_header Content-Security-Policy \"" + csp + "\" always;\n";
    }
    block += Indented(rendered, "        ") + "    }\n";
    return block;
}

}  // namespace

const char* AppPortalDir() {
    return "/usr/corv/etc/www/app.d";
}

std::string RenderPortalServer() {
    if (VLIBCFileCheckDir(AppPortalDir()) != 1) {
        return "";
    }
    corvplat::SzListHolder names(64);
    if (!names || VLIBCFileEnumDir(AppPortalDir(), ".mustache", names.addr(), 0) < 0) {
        return "";
    }
    std::set<std::string> aliases;
    std::string locations;
    for (int i = 0; i < VLIBCSzListCount(names.get()); ++i) {
        std::string pkg = VLIBCSzListGet(names.get(), i);
        pkg.resize(pkg.size() - std::string(".mustache").size());
        if (IsPathSegment(pkg)) {
            locations += RenderPortal(pkg, aliases);
        }
    }
    if (locations.empty()) {
        return "";
    }
    Engine engine;
    NOS nos(&engine);
    std::string server = "# The system web server with the packages' portals.\nserver {\n";
    server += "    listen " + std::to_string(nos.GetHttpPort()) + ";\n";
    std::string certDir;
    if (CORVCertDefaultDir(certDir)) {
        server += "    listen " + std::to_string(nos.GetHttpsPort()) + " ssl;\n";
        server += "    ssl_certificate " + certDir + "/fullchain.pem;\n";
        server += "    ssl_certificate_key " + certDir + "/privkey.pem;\n";
    }
    server += "    server_name _;\n";
    return server + locations + "}\n";
}

}  // namespace corvw3
