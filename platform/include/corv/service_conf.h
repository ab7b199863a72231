// Port declarations of the reference platform: which network ports a service uses, kept
// as one protocol file per owner in a directory that the firewall and the port-conflict
// test read.
//
// Type 2 is the package type, directory /usr/local/etc/services.d/ (the only type here).
// A protocol file is a section file of key="value" lines, one section per service:
//   [myservice]
//   title="My service"
//   desc="What it serves"
//   port_forward="yes"
//   dst.ports="8080,9000:9010/tcp"
// "dst.ports" is a comma-separated list of ports and from:to ranges (1-65535), a "/" and
// the protocols, "tcp", "udp" or "tcp,udp". A file is accepted when every section has a
// "dst.ports" of that form and there is at least one section.
#pragma once

#include <string>
#include <vector>

#define CORV_SERVICE_CONF_PKG_DIR "/usr/local/etc/services.d"

// One declared range.
struct CORVSERVICECONFPORT {
    std::string service;   // the section
    std::string protocol;  // "tcp" or "udp"
    int from;
    int to;
};
struct CORVSERVICECONFPORTS {
    std::vector<CORVSERVICECONFPORT> ports;
};
typedef CORVSERVICECONFPORTS* PCORVSERVICECONFPORTS;

// The ranges of a protocol file into a new list (`*ports`, freed with
// CORVServiceConfPortsFree). 0, or -1 with ERR_NO_SUCH_FILE or ERR_MALFORMED.
int CORVServiceConfParse(const char* path, PCORVSERVICECONFPORTS* ports);
// Installs the protocol file `path` as <dir of type>/<name> (a base name, no "/"), when it
// parses; `*ports` (may be null) gets its ranges. Install refuses an existing file
// (ERR_CREATE_FAILED), Update replaces it. 0, or -1 (ERR_BAD_PARAMETERS, ERR_MALFORMED,
// ERR_NO_SUCH_FILE, ERR_WRITE_FAILED).
int CORVServiceConfInstallBaseName(const char* name, const char* path, int type,
                                   PCORVSERVICECONFPORTS* ports);
int CORVServiceConfUpdateBaseName(const char* name, const char* path, int type,
                                  PCORVSERVICECONFPORTS* ports);
// Removes <dir of type>/<name>; a missing file is success. 0, or -1.
int VLIBServiceConfRemoveBaseName(const char* name, int type);
void CORVServiceConfPortsFree(PCORVSERVICECONFPORTS ports);
// Whether a protocol file of the directory other than `exceptName` (may be null) declares
// a port of from..to for `protocol` ("tcp"/"udp"). 1 yes, 0 no.
int CORVServiceConfPortTaken(const char* protocol, int from, int to, const char* exceptName);
