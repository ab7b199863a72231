// The platform's firewall rules.
#pragma once

// Reloads the firewall rules, which the reference platform only records: each call appends
// one line "<seconds since the epoch> reload" to /run/corvfw/reloads (no rule of the host
// changes). 0, or -1 with 0x0B00 when the record cannot be written.
int CORVFwRuleHup();
