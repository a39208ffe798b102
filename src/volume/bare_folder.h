// The bare folder below a volume's mount. Whatever is written into it while the volume is away would go to
// the system's own disk, be hidden by the next mount and deleted with the folder. So it carries the immutable
// flag from its making until its removal: nobody, root included, can make a file in it. File systems without
// that flag, and folders on another file system than the mount root (inside another volume), are left as they
// are; so is the root of a mounted volume. Nothing is said of failures.
#ifndef REMVOL_VOLUME_BARE_FOLDER_H
#define REMVOL_VOLUME_BARE_FOLDER_H

namespace remvol {

// Makes the folder, when it is not there, and the missing ones between the mount root and it; sets the flag.
// Requires a path below the mount root. A folder that a killed run left is used again.
void make_bare_folder(const char* path);

// Takes the flag off the folder and those below it. One that has it is removed here when it is empty: there
// is no moment in which it could take data. Requires that nothing is mounted on the path or below it.
void drop_bare_folder(const char* path);

}  // namespace remvol

#endif
