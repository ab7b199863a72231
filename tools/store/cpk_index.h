// `corv-store index DIR`: the catalogue of a directory of package files.
#pragma once

#include <json/json.h>

#include <string>

namespace store {

// The store entry of one package file, read from its INFO, conf/PKG_DEPS and
// conf/PKG_CONX without unpacking anything else; `link` is the file's name relative to
// the store directory. Its icons are written to DIR/icons/ and named in `thumbnail`.
// False, with the reason in `error`, for a file that is not a package.
bool indexPackageFile(const std::string& dir, const std::string& fileName, Json::Value& entry,
                      std::string& error);

// Indexes every "*.cpk" directly in `dir` and writes DIR/catalogue.json in one rename.
// Of several files of one package the highest version is kept. Prints one line per file
// skipped to standard error. The exit status: 0 when every file was indexed, 1 when some
// were skipped (the catalogue is written all the same), 2 when it can't be written.
int indexDirectory(const std::string& dir);

}  // namespace store
