// The desktop's application configuration: one JSON object per unit file.
#include "corv/nds_jsconfig.h"

#include <errno.h>
#include <string.h>
#include <sys/stat.h>

#include "corv/log.h"
#include "corv/vlibc.h"
#include "json_store.h"
#include "sz_holder.h"

namespace CORV {
namespace NDS {

namespace {

constexpr const char kSuffix[] = ".json";

bool isUnitName(const std::string& name) {
    return !name.empty() && name[0] != '.' && name.find('/') == std::string::npos;
}

}  // namespace

JSConfigParser::JSConfigParser(const std::string& language)
    : JSConfigParser(CorvConf(), language) {}

JSConfigParser::JSConfigParser(const CorvConf& conf, const std::string& language)
    : conf_(conf), language_(language), configs_(Json::objectValue) {}

bool JSConfigParser::parseUnit(const std::string& unit, Json::Value& value) const {
    const std::string path = conf_.jsconfigDir + "/" + unit + kSuffix;
    switch (corvplat::readJsonFile(path, value)) {
        case corvplat::JsonRead::kMissing:
            VLIBCErrSet(ERR_NO_SUCH_FILE);
            return false;
        case corvplat::JsonRead::kBad:
            return false;
        case corvplat::JsonRead::kOk:
            break;
    }
    if (!value.isObject()) {
        CORV_LOG_ERR("%s is no JSON object", path.c_str());
        VLIBCErrSet(ERR_READ_FAILED);
        return false;
    }
    return true;
}

bool JSConfigParser::Parse(const char* unit) {
    if (unit != nullptr && unit[0] != '\0') {
        if (!isUnitName(unit)) {
            VLIBCErrSet(ERR_BAD_PARAMETERS);
            return false;
        }
        Json::Value value;
        if (!parseUnit(unit, value)) {
            return false;
        }
        configs_[unit] = value;
        return true;
    }

    configs_ = Json::Value(Json::objectValue);
    struct stat st {};
    if (stat(conf_.jsconfigDir.c_str(), &st) != 0 && errno == ENOENT) {
        return true;
    }
    corvplat::SzListHolder names(64);
    if (!names || VLIBCFileEnumDir(conf_.jsconfigDir.c_str(), kSuffix, names.addr(), 0) < 0) {
        CORV_LOG_ERR("Failed to list %s [0x%04X %s:%d]", conf_.jsconfigDir.c_str(), VLIBCErrGet(),
                     VLIBCErrorGetFile(), VLIBCErrorGetLine());
        return false;
    }
    for (int i = 0; i < VLIBCSzListCount(names.get()); ++i) {
        const std::string file = VLIBCSzListGet(names.get(), i);
        const std::string name = file.substr(0, file.size() - strlen(kSuffix));
        if (!isUnitName(name)) {
            continue;
        }
        Json::Value value;
        if (!parseUnit(name, value)) {
            CORV_LOG_ERR("Configuration unit %s left out [0x%04X %s:%d]", file.c_str(),
                         VLIBCErrGet(), VLIBCErrorGetFile(), VLIBCErrorGetLine());
            continue;
        }
        configs_[name] = value;
    }
    return true;
}

Json::Value JSConfigParser::GetJSConfigs() const {
    return configs_;
}

const std::string& JSConfigParser::GetLanguage() const {
    return language_;
}

}  // namespace NDS
}  // namespace CORV
