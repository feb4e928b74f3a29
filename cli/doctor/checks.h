// The parts of an examination. Each reports what it finds to the examination, and throws Problem or
// Error where it cannot look. Some take the locks of what they mend.

#ifndef QUARRY_CLI_DOCTOR_CHECKS_H_
#define QUARRY_CLI_DOCTOR_CHECKS_H_

#include "cli/doctor/examination.h"

namespace quarry::cli {

// State files that cannot be read. They are set aside under another name, and replaced by what can
// be derived: from what can still be read of them, and from the other files. The shares come first,
// the others need them.
void CheckShareFile(Examination& examination);
void CheckEngineList(Examination& examination);
void CheckFolderList(Examination& examination);
void CheckStatusFile(Examination& examination);

// What processes that were killed have left: sockets, pid files, temporary files.
void CheckLeftovers(Examination& examination);

// Daemons that do not run, or do not answer.
void CheckServices(Examination& examination);

// Shares that have vanished, and folders that cannot be indexed any longer.
void CheckShares(Examination& examination);

// What the change monitor is to watch.
void CheckRegistrations(Examination& examination);

// Lines in the queues that are no events.
void CheckQueues(Examination& examination);

// Indexes that are damaged, missing, or marked as to be made anew.
void CheckIndexes(Examination& examination);

// All of them, in an order in which what one mends helps the next.
void ExamineSystem(Examination& examination);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_DOCTOR_CHECKS_H_
