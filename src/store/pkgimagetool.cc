// Package icons: decoded from INFO, fetched from a store, kept in the image cache.
#include "corvpkg/pkgimagetool.h"

#include <stdio.h>
#include <string.h>
#include <strings.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "corv/handles.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/packagemanager.h"
#include "corvpkg/pkgcurltool.h"
#include "corvpkg/pkgvolume.h"

namespace CORVPackageTool {

namespace {

constexpr int kInternalBufferSize = 4096;

bool isImageType(PKG_INFO_TYPE type) {
    return type == PKG_INFO_PACKAGE_ICON || type == PKG_INFO_PACKAGE_ICON_256;
}

const std::string& iconText(const PackageInfo& info, PKG_INFO_TYPE type) {
    return type == PKG_INFO_PACKAGE_ICON ? info.package_icon : info.package_icon_256;
}

bool decodeBase64(const std::string& text, std::string& bytes) {
    std::vector<unsigned char> buffer(text.size() + 1);
    const int length = VLIBCBase64Decode(text.data(), static_cast<int>(text.size()), buffer.data(),
                                         static_cast<int>(buffer.size()));
    if (length < 0) {
        CORV_LOG_ERR("Failed to decode base64");
        return false;
    }
    bytes.assign(reinterpret_cast<const char*>(buffer.data()), static_cast<size_t>(length));
    return true;
}

// Writes the decoded `text` to `path` under the file's lock.
bool saveBase64(const std::string& text, const std::string& path) {
    std::string bytes;
    if (!decodeBase64(text, bytes)) {
        return false;
    }
    const int lock = PMSLockFile(path.c_str(), true);
    FILE* file = fopen(path.c_str(), "wb");
    bool ok = file != nullptr && fwrite(bytes.data(), 1, bytes.size(), file) == bytes.size();
    if (file != nullptr && fclose(file) != 0) {
        ok = false;
    }
    PMSUnlockFile(lock);
    if (!ok) {
        CORV_LOG_ERR("failed to save data");
    }
    return ok;
}

bool endsWithImageExtension(const std::string& name) {
    const size_t dot = name.rfind('.');
    if (dot == std::string::npos) {
        return false;
    }
    const std::string ext = name.substr(dot + 1);
    return strcasecmp(ext.c_str(), "jpg") == 0 || strcasecmp(ext.c_str(), "png") == 0;
}

// Fetches `url` into `path` and checks what the server said it is.
bool fetchImage(const char* url, const std::string& path) {
    std::string contentType, effectiveUrl;
    int timeout = PKG_IMAGE_FETCH_SECONDS;
    if (!PMSDownloadFile(url, path.c_str(), &contentType, &effectiveUrl, &timeout)) {
        return false;
    }
    // "image/png; charset=..." is still a png.
    const std::string type = contentType.substr(0, contentType.find(';'));
    if (!type.empty() && strcasecmp(type.c_str(), "image/jpeg") != 0 &&
        strcasecmp(type.c_str(), "image/png") != 0) {
        CORV_LOG_ERR("Wrong content type %s in %s", contentType.c_str(), url);
        return false;
    }
    std::string name;
    PMSParseUrlToFileName(effectiveUrl.empty() ? url : effectiveUrl.c_str(), name);
    if (!endsWithImageExtension(name)) {
        CORV_LOG_ERR("Wrong file type %s in %s", name.c_str(), url);
        return false;
    }
    return true;
}

bool startsWithHttp(const char* source) {
    return strncasecmp(source, "http://", 7) == 0 || strncasecmp(source, "https://", 8) == 0;
}

// The cache path of `fileName` for the package version, into `out`.
bool cachePath(const char* category, const char* packageName, const char* version,
               const char* fileName, char* out, int outSize, std::string& path) {
    std::string dir;
    if (!PMSGetImageTmpPath(category, packageName, version, dir)) {
        return false;
    }
    path = dir + "/" + fileName;
    if (path.find('/', dir.size() + 1) != std::string::npos || strstr(fileName, "..") != nullptr) {
        CORV_LOG_ERR("Bad image file name %s", fileName);
        return false;
    }
    snprintf(out, static_cast<size_t>(outSize), "%s", path.c_str());
    return true;
}

void dropFile(const char* out) {
    if (out != nullptr && out[0] != '\0') {
        unlink(out);
    }
}

}  // namespace

bool PMSIsValidImageFile(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode) &&
           static_cast<unsigned long long>(st.st_size) > PKG_IMAGE_MIN_BYTES &&
           static_cast<unsigned long long>(st.st_size) < PKG_IMAGE_MAX_BYTES;
}

bool PMSGetImageByPath(PKG_INFO_TYPE type, const char* path, std::string& image) {
    if (path == nullptr) {
        CORV_LOG_ERR("Bad Parameters (szPath is null)");
        return false;
    }
    if (!isImageType(type)) {
        CORV_LOG_ERR("Wrong image type");
        return false;
    }
    PackageManager pm;
    PackageInfo info;
    if (!pm.getPackageInfoByPath(path, info, nullptr)) {
        CORV_LOG_ERR("Failed to get package info from [%s]", path);
        return false;
    }
    const std::string& text = iconText(info, type);
    return !text.empty() && decodeBase64(text, image);
}

bool PMSGetInstallImageByName(PKG_INFO_TYPE type, const char* packageName, std::string& image) {
    if (packageName == nullptr) {
        CORV_LOG_ERR("Bad Parameters (szPkgName is null)");
        return false;
    }
    return PMSGetImageByPath(type, (std::string("/var/packages/") + packageName).c_str(), image);
}

bool PMSGetServerImage(const char* category, const char* packageName, const char* version,
                       const char* fileName, const char* source, char* out, int outSize) {
    char internal[kInternalBufferSize] = {0};
    if (out == nullptr) {
        out = internal;
        outSize = sizeof internal;
    }
    if (packageName == nullptr || version == nullptr || fileName == nullptr || outSize <= 0) {
        return false;
    }
    out[0] = '\0';
    std::string path;
    if (!cachePath(category, packageName, version, fileName, out, outSize, path)) {
        return false;
    }
    if (PMSIsValidImageFile(path)) {
        return true;
    }
    unlink(path.c_str());
    const bool fetched = source != nullptr && (startsWithHttp(source) ? fetchImage(source, path)
                                                                      : saveBase64(source, path));
    if (fetched && PMSIsValidImageFile(path)) {
        return true;
    }
    dropFile(out);
    return false;
}

bool PMSGetInstallImage(PKG_INFO_TYPE type, const char* category, const char* packageName,
                        const char* version, const char* fileName, char* out, int outSize) {
    if (out == nullptr || outSize <= 0) {
        return false;
    }
    out[0] = '\0';
    if (packageName == nullptr || version == nullptr || fileName == nullptr || !isImageType(type)) {
        return false;
    }
    std::string path;
    if (!cachePath(category, packageName, version, fileName, out, outSize, path)) {
        return false;
    }
    if (PMSIsValidImageFile(path)) {
        return true;
    }
    unlink(path.c_str());
    PackageManager pm;
    PackageInfo info;
    if (pm.getInstallPackageInfo(packageName, info, nullptr, PKG_INFO_MASK_ALL) &&
        !iconText(info, type).empty() && saveBase64(iconText(info, type), path) &&
        PMSIsValidImageFile(path)) {
        return true;
    }
    dropFile(out);
    return false;
}

}  // namespace CORVPackageTool
