// Texts of a package's own language files, for the words that its wizard and messages use.
#include <stdio.h>

#include <string>

#include "common/vlibc_holders.h"
#include "corv/log.h"
#include "corv/vlibc.h"
#include "corvpkg/pkgwizard.h"

namespace CORVPackageTool {

namespace {

constexpr int kTextHashCapacity = 1024;

}  // namespace

std::string PMSGetText(const std::string& package, const std::string& language,
                       const std::string& section, const std::string& key) {
    char path[1024];
    snprintf(path, sizeof(path), "/var/packages/%s/target/ui/texts/%s/strings", package.c_str(),
             language.c_str());
    SzHash texts(kTextHashCapacity);
    if (!texts) {
        CORV_LOG_ERR("Out of memory");
        return "";
    }
    if (VLIBCFileGetSection(path, section.c_str(), texts.addr()) <= 0) {
        CORV_LOG_ERR("[%s] no found the section[%s] [0x%04X %s:%d]", path, section.c_str(),
                     VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return "";
    }
    const char* text = VLIBCSzHashGetValue(texts.get(), key.c_str());
    if (text == nullptr) {
        CORV_LOG_ERR("key no found [%s] ", key.c_str());
        return "";
    }
    return text;
}

}  // namespace CORVPackageTool
