// The desktop's application configuration (NDS: the appliance's desktop).
//
// Where it comes from: every file "<unit>.json" in the directory NDS_JSCONFIG_DIR (or the
// directory a CorvConf names) is one configuration unit; its content is a JSON object
// that maps application ids to the application's settings, e.g.
//   /usr/corv/etc/nds/jsconfig.d/photo.json:
//   { "CORV.Photo.Application": { "grantPrivilege": "local", "configablePrivilege": true,
//                                 "advanceGrantPrivilege": false, ... } }
// Packages and the system drop their units there. Names beginning with a dot are not
// units (editors' and installers' temporary files).
//
// Order: GetJSConfigs gives one JSON object with a member per unit, named after the file
// without ".json". JSON objects keep their members sorted by name (byte order), so every
// walk over the units, getMemberNames included, goes in that order, which is also the
// order of the file names: a unit named "00-system" comes before "photo".
#pragma once

#include <json/json.h>

#include <string>

#define NDS_JSCONFIG_DIR "/usr/corv/etc/nds/jsconfig.d"

namespace CORV {
namespace NDS {

// The desktop's configuration settings that the parser needs.
struct CorvConf {
    std::string jsconfigDir = NDS_JSCONFIG_DIR;
};

class JSConfigParser {
  public:
    // A parser for the desktop in `language` (a language key such as "enu"). Nothing is
    // read before Parse. The settings used for privileges do not depend on the
    // language; it is kept for the texts of the configuration.
    explicit JSConfigParser(const std::string& language);
    JSConfigParser(const CorvConf& conf, const std::string& language);

    // With `unit` null or empty: reads every unit, replacing what was parsed before. A
    // missing directory is no configuration at all (true, no unit). A unit that cannot be
    // read or is no JSON object is logged and left out, so that one broken file does not
    // hide the others. False only when the directory exists but cannot be listed.
    // With a unit name: reads that unit alone and adds (or replaces) it. False, with the
    // error slot set, when it is missing (ERR_NO_SUCH_FILE), unreadable or no object
    // (ERR_READ_FAILED), or the name is no plain file name (ERR_BAD_PARAMETERS).
    bool Parse(const char* unit);

    // The units parsed so far: a JSON object, empty before Parse.
    Json::Value GetJSConfigs() const;
    const std::string& GetLanguage() const;

  private:
    bool parseUnit(const std::string& unit, Json::Value& value) const;
    CorvConf conf_;
    std::string language_;
    Json::Value configs_;
};

}  // namespace NDS
}  // namespace CORV
