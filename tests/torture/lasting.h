/* All that a run leaves behind in a box and that a later run may meet, as text that is the same for the same
 * state: the files that were made, changed or removed (with those that a mount hides, and their flags), the
 * mounts below /mnt, the semaphores. What the torture itself keeps in /fake is left out, and so are times and
 * the numbers of processes. */
#ifndef TORTURE_LASTING_H
#define TORTURE_LASTING_H

/* Writes it to the standard output; 0, or 1 when something could not be looked at. */
int lasting_show(void);

#endif
