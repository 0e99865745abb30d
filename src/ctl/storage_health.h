// quorletctl storage health: how worn every drive is, and how long it will last.
#ifndef QUORLET_CTL_STORAGE_HEALTH_H_
#define QUORLET_CTL_STORAGE_HEALTH_H_

#include <string>

#include "ctl/session.h"
#include "platform/drives.h"

namespace quorlet {

// Prints the table, or with `json` an object with an array "drives". A drive that sleeps has a
// note. Throws Failure when there is no drive or none could be asked, and, with all the others
// printed, when one could not be asked.
void PrintStorageHealth(Session& session, bool json);

// Why the drive does not tell, in words for people; empty when it tells.
std::string DriveTrouble(const Drive& drive);

}  // namespace quorlet

#endif  // QUORLET_CTL_STORAGE_HEALTH_H_
