// Volume collection on a controller: converts this controller's volume source
// files into ".cfgp" files, loads them, and merges them into the "volumes" of
// the configuration being built.
#ifndef KOLT_VOLUMES_VOLUME_COLLECTION_H
#define KOLT_VOLUMES_VOLUME_COLLECTION_H

#include "kolt/plist.h"

namespace kolt {

// Change flags of the controller-side build.
enum BuildChangeFlag : int {
  kBuildPublish = 1,         // the record changed and must be saved
  kBuildNewController = 32,  // this machine was not in the controller table
};

// Merges the volume files of the volumes this controller hosts (fsmlist)
// into `volumes` (a dictionary, changed in place), and sets kBuildPublish in
// `changeFlags` when an entry changed:
// - a newer ".cfg" or ".cfgx" is converted with pdcfgconvert into a ".cfgp"
//   dated as its source, which then goes; the ".cfgp" is replaced in one
//   step, only with output that parses;
// - an entry is current when its "mtime" and the ".cfgp" date share their
//   whole second (the record keeps whole seconds);
// - this controller's UUID is added to each volume it has files for, and
//   removed from the others (a new controller, kBuildNewController, adds it
//   to every volume and then applies `volumes` to its local volume files).
// A failed conversion or directory listing is logged and leaves `volumes`,
// the flags and the volume files as they were. Never fails the build.
void buildVolumeConfig(Value& volumes, int* changeFlags);

// Dates at the precision the published record carries (whole seconds).
bool sameWholeSecond(double a, double b);

}  // namespace kolt

#endif  // KOLT_VOLUMES_VOLUME_COLLECTION_H
