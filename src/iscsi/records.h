// The initiator's own records of targets and interfaces, as files.
#ifndef REMVOL_ISCSI_RECORDS_H
#define REMVOL_ISCSI_RECORDS_H

namespace remvol {

// Removes the records that are empty files; each is told at level 0. iscsiadm writes its records without a
// sync, so a power cut can leave such a file, and then neither deletes nor replaces it (seen with 2.1.8):
// every login to the target fails, "No records found". To be called while no iscsiadm is at work.
void drop_empty_records();

}  // namespace remvol

#endif
