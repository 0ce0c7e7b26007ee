// The check, made once per Open, whether the transfer tool "./curl" can
// deliver over SMTPS. It runs the tool through the host's process service, so
// it blocks the calling thread (the host thread of Open) until the tool ends.
#ifndef ALERTMOD_MAIL_SMTP_PROBE_H_
#define ALERTMOD_MAIL_SMTP_PROBE_H_

#include "alertmod/config/notify_cfg.h"

namespace hx {

// Runs "./curl -V" and sets the configuration's SMTPS flag when the tool's
// standard output mentions "smtps" anywhere; clears it otherwise, also when
// the tool cannot be started. Returns the flag.
bool ProbeSmtps(NotifyCfg& config);

}  // namespace hx

#endif  // ALERTMOD_MAIL_SMTP_PROBE_H_
