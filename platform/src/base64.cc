// Base64 as the package icons of INFO files and stores carry them.
#include <ctype.h>

#include "corv/vlibc.h"

namespace {

int sextet(unsigned char c) {
    if (c >= 'A' && c <= 'Z')
        return c - 'A';
    if (c >= 'a' && c <= 'z')
        return c - 'a' + 26;
    if (c >= '0' && c <= '9')
        return c - '0' + 52;
    if (c == '+' || c == '-')
        return 62;
    if (c == '/' || c == '_')
        return 63;
    return -1;
}

}  // namespace

int VLIBCBase64Decode(const char* in, int inLength, unsigned char* out, int outSize) {
    if (in == nullptr || inLength < 0 || (out == nullptr && outSize != 0)) {
        VLIBCErrSet(ERR_BAD_PARAMETERS);
        return -1;
    }
    unsigned int bits = 0;
    int count = 0, written = 0;
    for (int i = 0; i < inLength; ++i) {
        const unsigned char c = static_cast<unsigned char>(in[i]);
        if (c == '=') {
            break;
        }
        if (isspace(c)) {
            continue;
        }
        const int value = sextet(c);
        if (value < 0) {
            VLIBCErrSet(ERR_BAD_PARAMETERS);
            return -1;
        }
        bits = (bits << 6) | static_cast<unsigned int>(value);
        count += 6;
        if (count >= 8) {
            count -= 8;
            if (written >= outSize) {
                VLIBCErrSet(ERR_BUF_TOO_SMALL);
                return -1;
            }
            out[written++] = static_cast<unsigned char>((bits >> count) & 0xFF);
        }
    }
    return written;
}
