// The platform's package signature tool, as the library runs it.
//
// On the appliance the tool is "/usr/bin/php -dopen_basedir=/ /usr/corv/bin/codesign.php";
// on the reference platform it is our own program /usr/corv/bin/corv-codesign. Either
// way its contract is the command line and the exit status:
//   --verify <absolute path of a .cpk>   0 signed with the maker's key, 1 by a known
//                                        publisher (a key added for a feed), 2 unknown
//                                        publisher, 3 no signature, 4 expired key,
//                                        5 bad signature (the file changed after signing),
//                                        anything else: the tool failed
//   --addserver <key file> <feed URL>    trust the keys of this feed
//   --delserver <feed URL>               forget them
//   --sign <key> <.cpk path>             (reference platform) sign a package file in place
#pragma once

// The program and the arguments that come before the tool's own, null-terminated.
const char* const* CORVCodesignCommand();
