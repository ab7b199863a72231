// Mail to the administrators of the machine.
//
// A message is made from a template of the platform and the fields of a hash: every
// "%KEY%" of the template's subject and body is replaced by the field KEY's value (keys are
// written with their percent signs, "%PKG_SET%"). Templates of the reference platform:
//   "PKGUpgrade"  subject "Package updates are available"; body "New versions of these
//                 packages can be installed: %PKG_SET%"
// The recipient is the key "mail_admin" of /etc/corvinfo.conf, "root" when it is missing.
//
// Delivery: through /usr/sbin/sendmail (-t -i) in a detached child when that program is
// there; otherwise the message is appended to the spool file CORV_MAIL_SPOOL in mbox form
// ("From corv-mail <asctime>" line, headers, body, blank line), under an flock of that file,
// for a mail daemon or a person to pick up.
#pragma once

#include "corv/vlibc.h"

#define CORV_MAIL_SPOOL "/var/spool/corv/mail.mbox"
#define CORV_MAIL_SENDMAIL "/usr/sbin/sendmail"

// Sends the message of `templateName` with `fields` (may be null) without waiting for the
// delivery. `flags` and `reserved` are for the appliance's mail service; pass 0. 0 once
// the message is spooled or handed to sendmail, -1 for an unknown template
// (ERR_BAD_PARAMETERS) or a failed spool write (ERR_WRITE_FAILED) or fork.
int CORVMailSendMessageWithoutBlock(const char* templateName, PVLIBSZHASH fields, int flags,
                                    int reserved);
