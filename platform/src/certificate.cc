// The default certificate of the machine's store.
#include "corv/certificate.h"

#include <fstream>
#include <string>

#include "corv/vlibc.h"

bool CORVCertDefaultDir(std::string& dir) {
    std::ifstream in(CORV_CERT_ARCHIVE "/DEFAULT");
    std::string id;
    if (!std::getline(in, id) || id.empty() || id.find('/') != std::string::npos || id[0] == '.') {
        return false;
    }
    const std::string candidate = std::string(CORV_CERT_ARCHIVE) + "/" + id;
    for (const char* file : {"/cert.pem", "/privkey.pem", "/fullchain.pem"}) {
        if (VLIBCFileExist((candidate + file).c_str()) != 1) {
            return false;
        }
    }
    dir = candidate;
    return true;
}
