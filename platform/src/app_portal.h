// The packages' web portals, rendered into the system web server's configuration.
#pragma once

#include <string>

namespace corvw3 {

// A package's portal is the pair /usr/corv/etc/www/app.d/<pkg>.json (an object) and
// <pkg>.mustache (a template of nginx directives). The portal is served by the system web
// server under /<alias>/, where the alias is the member "alias" of the user's
// /usr/corv/etc/packages/<pkg>/AppPortal.json, else of the JSON fragment, else the
// package's name. The template is rendered with the fragment's members, overlaid by
// those of AppPortal.json, and "pkg", "alias" and "target" (/var/packages/<pkg>/target);
// {{name}} keeps only characters that cannot leave an nginx directive's argument
// (letters, digits and "._-/:@+="), {{{name}}} inserts the value as it stands. A package
// with content-security rules (corv/csp_rule.h) gets their header on every answer of
// its portal.
//
// The result is one server block listening on the system web server's HTTP port, and,
// when the machine has a default certificate, on its HTTPS port with that certificate;
// "" when no portal exists. A portal that cannot be rendered (unreadable fragment, bad
// template, alias that is not one path segment, or one that an earlier package in name
// order already took) is left out with a log line, so that one package cannot keep the
// others off the web server.
std::string RenderPortalServer();

const char* AppPortalDir();

}  // namespace corvw3
