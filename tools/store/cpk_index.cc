#include "cpk_index.h"

#include <dirent.h>
#include <fcntl.h>
#include <openssl/evp.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <vector>

#include "catalogue.h"
#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgtool.h"
#include "exit_status.h"
#include "tar_reader.h"

namespace store {

namespace {

// The members that describe a package; everything else in the file is payload.
const char* const kWantedMembers[] = {"INFO", "conf/PKG_DEPS", "conf/PKG_CONX", "PACKAGE_ICON.PNG",
                                      "PACKAGE_ICON_256.PNG"};
constexpr size_t kMemberLimit = 4 << 20;

struct FdCloser {
    int fd;
    ~FdCloser() {
        if (fd >= 0) {
            close(fd);
        }
    }
};

// The content of the wanted members of a tar file, by name ("./INFO" counts as "INFO").
std::map<std::string, std::string> readMembers(const std::string& path) {
    FdCloser file{open(path.c_str(), O_RDONLY | O_CLOEXEC)};
    if (file.fd < 0) {
        throw codesign::Failure("cannot open " + path);
    }
    std::map<std::string, std::string> found;
    codesign::TarReader reader(file.fd, path);
    codesign::TarMember member;
    while (reader.next(member)) {
        std::string name = member.name.rfind("./", 0) == 0 ? member.name.substr(2) : member.name;
        bool wanted = std::find(std::begin(kWantedMembers), std::end(kWantedMembers), name) !=
                      std::end(kWantedMembers);
        if (!wanted || member.kind != codesign::TarMember::kFile || member.size > kMemberLimit) {
            continue;
        }
        std::string& content = found[name];
        reader.readContent(
            [&content](const char* data, size_t size) { content.append(data, size); });
    }
    return found;
}

// Lower-case hexadecimal MD5 of a whole file, empty when it can't be read.
std::string md5OfFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> ctx(EVP_MD_CTX_new(), EVP_MD_CTX_free);
    if (!in || !ctx || EVP_DigestInit_ex(ctx.get(), EVP_md5(), nullptr) != 1) {
        return "";
    }
    std::vector<char> buffer(1 << 16);
    while (in.read(buffer.data(), buffer.size()) || in.gcount() > 0) {
        EVP_DigestUpdate(ctx.get(), buffer.data(), static_cast<size_t>(in.gcount()));
    }
    unsigned char digest[EVP_MAX_MD_SIZE];
    unsigned int length = 0;
    if (in.bad() || EVP_DigestFinal_ex(ctx.get(), digest, &length) != 1) {
        return "";
    }
    std::string hex;
    char piece[3];
    for (unsigned int i = 0; i < length; ++i) {
        snprintf(piece, sizeof piece, "%02x", digest[i]);
        hex += piece;
    }
    return hex;
}

// A scratch directory that is removed with everything in it.
class ScratchDir {
  public:
    ScratchDir() {
        char tmpl[] = "/tmp/corv-store-XXXXXX";
        if (mkdtemp(tmpl) != nullptr) {
            path_ = tmpl;
        }
    }
    ~ScratchDir() {
        if (!path_.empty()) {
            std::error_code ignored;
            std::filesystem::remove_all(path_, ignored);
        }
    }
    const std::string& path() const { return path_; }

  private:
    std::string path_;
};

bool writeFile(const std::string& path, const std::string& content) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << content;
    return static_cast<bool>(out.flush());
}

std::string rawInfoValue(const std::string& infoPath, const char* key) {
    char value[4096] = {0};
    if (VLIBCFileGetKeyValue(infoPath.c_str(), key, value, sizeof value, 0) <= 0) {
        return "";
    }
    return value;
}

// The icons go to DIR/icons/<package>-<version>[_256].png.
Json::Value publishIcons(const std::string& dir, const CORVPackageTool::PackageInfo& info,
                         const std::map<std::string, std::string>& members) {
    Json::Value thumbnails(Json::arrayValue);
    const std::pair<const char*, const char*> icons[] = {{"PACKAGE_ICON.PNG", ".png"},
                                                         {"PACKAGE_ICON_256.PNG", "_256.png"}};
    for (const auto& icon : icons) {
        auto it = members.find(icon.first);
        if (it == members.end()) {
            continue;
        }
        std::string relative = "icons/" + info.package + "-" + info.version + icon.second;
        mkdir((dir + "/icons").c_str(), 0755);
        if (writeFile(dir + "/" + relative, it->second)) {
            thumbnails.append(relative);
        }
    }
    return thumbnails;
}

void fillEntry(const CORVPackageTool::PackageInfo& info, const std::string& infoPath,
               Json::Value& entry) {
    entry["package"] = info.package;
    entry["version"] = info.version;
    entry["dname"] = info.displayname.empty() ? info.package : info.displayname;
    entry["desc"] = info.description;
    entry["maintainer"] = info.maintainer;
    entry["maintainer_url"] = info.maintainer_url;
    entry["distributor"] = info.distributor;
    entry["distributor_url"] = info.distributor_url;
    entry["silent_install"] = info.silent_install;
    entry["silent_upgrade"] = info.silent_upgrade;
    entry["silent_uninstall"] = info.silent_uninstall;
    entry["beta"] = info.beta;
    std::string services = rawInfoValue(infoPath, "install_dep_services");
    if (!services.empty()) {
        entry["depsers"] = services;
    }
    Json::Value deps, conflicts;
    info.dep_packages.toJSON(deps);
    info.conflict_packages.toJSON(conflicts);
    if (!deps.isNull()) {
        entry["conf_deppkgs"] = deps;
    }
    if (!conflicts.isNull()) {
        entry["conf_conxpkgs"] = conflicts;
    }
}

}  // namespace

bool indexPackageFile(const std::string& dir, const std::string& fileName, Json::Value& entry,
                      std::string& error) {
    const std::string path = dir + "/" + fileName;
    std::map<std::string, std::string> members;
    try {
        members = readMembers(path);
    } catch (const std::exception& failure) {
        error = failure.what();
        return false;
    }
    if (members.count("INFO") == 0) {
        error = "no INFO member: not a package file";
        return false;
    }
    ScratchDir scratch;
    if (scratch.path().empty() || mkdir((scratch.path() + "/conf").c_str(), 0755) != 0) {
        error = "cannot make a scratch directory in /tmp";
        return false;
    }
    for (const auto& member : members) {
        if (member.first == "INFO" || member.first.rfind("conf/", 0) == 0) {
            writeFile(scratch.path() + "/" + member.first, member.second);
        }
    }
    CORVPackageTool::PackageInfo info;
    if (!CORVPackageTool::PMSLoadPKGInfoFile(scratch.path(), info, "enu", ~0ULL)) {
        error = "its INFO does not read as a package's (package, version, ...)";
        return false;
    }
    struct stat st {};
    const std::string md5 = md5OfFile(path);
    if (stat(path.c_str(), &st) != 0 || md5.empty()) {
        error = "cannot read the file";
        return false;
    }
    entry = Json::Value(Json::objectValue);
    fillEntry(info, scratch.path() + "/INFO", entry);
    entry["size"] = Json::Value::UInt64(st.st_size);
    entry["md5"] = md5;
    entry["link"] = fileName;
    Json::Value thumbnails = publishIcons(dir, info, members);
    if (!thumbnails.empty()) {
        entry["thumbnail"] = thumbnails;
    }
    return true;
}

namespace {

std::vector<std::string> packageFiles(const std::string& dir) {
    std::vector<std::string> names;
    std::error_code failed;
    for (const auto& item : std::filesystem::directory_iterator(dir, failed)) {
        const std::string name = item.path().filename().string();
        if (name.size() > 4 && name.compare(name.size() - 4, 4, ".cpk") == 0 &&
            item.is_regular_file()) {
            names.push_back(name);
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

bool isNewer(const Json::Value& entry, const Json::Value& than) {
    CORVPackageTool::PackageBasicInfo a(entry["package"].asString(), entry["version"].asString());
    CORVPackageTool::PackageBasicInfo b(than["package"].asString(), than["version"].asString());
    return a.compare(b, CORVPackageTool::PKG_COMPOP_GT);
}

}  // namespace

int indexDirectory(const std::string& dir) {
    if (!std::filesystem::is_directory(dir)) {
        fprintf(stderr, "corv-store: %s is not a directory\n", dir.c_str());
        return 2;
    }
    Json::Value packages(Json::arrayValue);
    std::map<std::string, Json::ArrayIndex> byName;
    int skipped = 0;
    for (const std::string& name : packageFiles(dir)) {
        Json::Value entry;
        std::string error;
        if (!indexPackageFile(dir, name, entry, error)) {
            fprintf(stderr, "corv-store: skipped %s: %s\n", name.c_str(), error.c_str());
            ++skipped;
            continue;
        }
        auto seen = byName.find(entry["package"].asString());
        if (seen == byName.end()) {
            byName[entry["package"].asString()] = packages.size();
            packages.append(entry);
        } else if (isNewer(entry, packages[seen->second])) {
            packages[seen->second] = entry;
        }
    }
    Json::Value catalogue(Json::objectValue);
    catalogue["packages"] = packages;
    const std::string path = dir + "/" + kCatalogueFile;
    if (!CORVPackageTool::toFile(catalogue, path)) {
        fprintf(stderr, "corv-store: cannot write %s\n", path.c_str());
        return 2;
    }
    printf("indexed %u package(s) into %s\n", packages.size(), path.c_str());
    return skipped == 0 ? 0 : 1;
}

}  // namespace store
