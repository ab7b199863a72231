// The device's identity towards package stores.
//
// Settings, all in key="value" files:
//   /etc.defaults/corvinfo.conf  package_server   the maker store's address, e.g.
//                                                 "https://store.example.com" (a trailing
//                                                 "/" is dropped); without it the device
//                                                 has no maker store
//                                unique           the device's identity ("corv_<platform>_<model>")
//                                corvpkg_server   set (to anything not empty) on a device
//                                                 with a store account: its queries carry
//                                                 the ns_time/ns_token pair
//   /etc/corvinfo.conf           package_update_channel  "stable" or "beta"; a device
//                                                 without it can't query any store
//                                timezone, language
// The reference platform's set-up writes package_update_channel="stable" when missing and
// leaves package_server and corvpkg_server to the administrator.
#pragma once

// The user agent of the device's HTTP requests for `type` ("package", ...), written into
// `buffer` of `size` bytes: "CorvNOS/6.1-15101 (<unique>) <type>". Its length, or -1
// (ERR_BAD_PARAMETERS for a null argument, ERR_KEY_NOT_FOUND without `unique`,
// ERR_BUF_TOO_SMALL when it does not fit).
int VLIBNsinfoUserAgentGet(const char* type, char* buffer, int size);

// The maker store's address, without a trailing "/", into `buffer` (4096 bytes, zeroed by
// the caller). Its length, or -1 (ERR_KEY_NOT_FOUND when package_server is missing or
// empty, ERR_READ_FAILED when the file can't be read).
int CORVMYNSServerConfigGet(char* buffer);

#define CORV_NSINFO_STORE_BUFFER 4096
