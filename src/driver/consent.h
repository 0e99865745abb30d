// The device owner's consent to submitting logs, and what was counted before it was given.
#ifndef QUORLET_DRIVER_CONSENT_H_
#define QUORLET_DRIVER_CONSENT_H_

#include <string>

#include "platform/platform.h"

namespace quorlet {

enum class Consent { kOff, kOn, kInvalid };

// What the preference says; kInvalid, which enables nothing, for a value that is not a boolean.
Consent consentOf(Preferences& preferences);

// Each of the following works with the pass lock held by the caller and returns false when it could
// not do what it says; the system log has an error line then.

// Consents. Counters recorded before are dropped, unless they are to be kept, so that nothing
// counted without consent is ever reported: the network usage service is asked, its answer becomes
// the baseline, and the write that consents notes that the drop is due. Without an answer, or when
// that write fails, nothing changes. Where consent was given already, only a drop that is due is
// made.
bool giveConsent(Platform& platform, bool keepCounters);

// Withdraws the consent durably, then removes every log that has not been taken away.
bool withdrawConsent(Platform& platform);

// Drops what is due to be dropped. Nothing counted may be reported before this returns true.
bool finishDueDrop(Platform& platform);

}  // namespace quorlet

#endif  // QUORLET_DRIVER_CONSENT_H_
