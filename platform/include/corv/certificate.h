// The machine's certificates and the services that use them.
//
// Store, under /usr/corv/etc/certificate/_archive:
//   <id>/cert.pem, <id>/privkey.pem, <id>/fullchain.pem   one certificate each
//   DEFAULT                                               the id of the default one
//   INFO   JSON object: id -> {"services": [entries]}, who uses which certificate; an
//          entry is a package service as /usr/local/share/certificate.d/<pkg>.cfg lists
//          it, with "subscriber" (the package), "owner" and "isPkg" added.
// A package's service gets the files of its certificate in
// /usr/local/etc/certificate/<pkg>/<service>/, owned by the package's user, key 0600.
//
// The tools /usr/corv/bin/corvcrtregister <pkg> and corvcrtunregister <pkg> (built from
// tools/platform/corvcrt.cc) add and remove a package's services; the system web server
// serves HTTPS with the default certificate.
#pragma once

#include <string>

#define CORV_CERT_ARCHIVE "/usr/corv/etc/certificate/_archive"
#define CORV_CERT_PKG_DEPLOY_DIR "/usr/local/etc/certificate"
#define CORV_CERT_PKG_CONF_DIR "/usr/local/share/certificate.d"
#define CORV_CERT_PKG_RELOADER_DIR "/usr/local/libexec/certificate.d"

// The directory of the default certificate, when DEFAULT names one whose three files are
// there; false otherwise.
bool CORVCertDefaultDir(std::string& dir);
