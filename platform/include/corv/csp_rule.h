// Content-security rules of packages: what the system web server sends as the
// Content-Security-Policy header of a package's portal.
#pragma once

#include <json/json.h>

#include <string>

namespace CORV {
namespace NOS {

// The rules of one package, kept in /usr/corv/etc/www/csp.d/<pkg>.json.
//
// Format: one JSON object whose members are directives ("default-src", "img-src" ...:
// lower-case letters and '-') and whose values are a source list: an array of sources
// or one text of sources separated by spaces ("'self' data:"). A source is printable
// ASCII without quotes other than the single quotes of keywords, ';', ',', '\\', '{', '}'
// or white space, so that a rule can neither end the header nor reach the web server's
// configuration. An empty list stands for 'none'.
class CspRule {
  public:
    // `type` 1: the rules of a package named `name`.
    CspRule(const std::string& name, int type);

    // Checks and stores the rules, then has the web server's configuration regenerated
    // and a running web server reloaded. False with 0x0D00 (bad name or type), 0x4000
    // (rules not in the format above) or the error of the write or the regeneration.
    bool Save(const Json::Value& rules);
    // Removes the package's rules and regenerates as Save does; no rules is success.
    bool Delete();

    // The header value of `rules` ("default-src 'self'; img-src 'self' data:"),
    // directives in name order. False with 0x4000 when the rules are malformed.
    static bool HeaderValue(const Json::Value& rules, std::string& out);
    // The stored rules' header value of package `name`; "" when it has none or they
    // are unreadable.
    static std::string HeaderOf(const std::string& name);
    static const char* Dir();

  private:
    std::string name_;
    int type_;
};

}  // namespace NOS
}  // namespace CORV
