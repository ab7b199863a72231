// Package icons for the desktop: from a package's INFO (base64 texts package_icon and
// package_icon_256), from a store entry (an http(s) URL or a base64 text), and from the
// image cache (PMSGetImageTmpPath: one folder per category, package and version).
//
// A cached image is valid when it is a regular file of more than 10 bytes and less than
// 2 MiB. A fetched image must come as image/jpeg or image/png (or with no content type at
// all) and its URL must end in .jpg or .png; the fetch is limited to 6 seconds. Whatever
// fails to be a valid image is removed again, so the cache never serves half an image.
#pragma once

#include <string>

#include "corvpkg/pkgtypes.h"
#include "corvpkg/visibility.h"

namespace CORVPackageTool {

constexpr unsigned long long PKG_IMAGE_MIN_BYTES = 10;       // a file must be larger
constexpr unsigned long long PKG_IMAGE_MAX_BYTES = 2097152;  // and smaller
constexpr int PKG_IMAGE_FETCH_SECONDS = 6;

// The decoded icon of the package in the directory `path` (its INFO); `type` is
// PKG_INFO_PACKAGE_ICON or PKG_INFO_PACKAGE_ICON_256. False for another type, an
// unreadable package, no icon or bad base64.
CORVPKG_API bool PMSGetImageByPath(PKG_INFO_TYPE type, const char* path, std::string& image);
// The same for the installed package `packageName`.
CORVPKG_API bool PMSGetInstallImageByName(PKG_INFO_TYPE type, const char* packageName,
                                          std::string& image);
// A store's image of a package version, cached as `fileName`; `source` is the URL or the
// base64 text. `out` (size `outSize`; null for an internal buffer) receives the file path.
CORVPKG_API bool PMSGetServerImage(const char* category, const char* packageName,
                                   const char* version, const char* fileName, const char* source,
                                   char* out, int outSize);
// The installed package's icon of `type` as a cached file; `out` receives its path.
CORVPKG_API bool PMSGetInstallImage(PKG_INFO_TYPE type, const char* category,
                                    const char* packageName, const char* version,
                                    const char* fileName, char* out, int outSize);
// Whether `path` is a valid cached image (see above).
CORVPKG_API bool PMSIsValidImageFile(const std::string& path);

}  // namespace CORVPackageTool
