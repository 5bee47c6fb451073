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
// `changeFlags` when an entry changed. A failed conversion leaves `volumes`
// and the flags untouched and the volume's files as they were. For a new
// controller (kBuildNewController) it then applies `volumes` to the local
// volume files. Never fails the build.
void buildVolumeConfig(Value& volumes, int* changeFlags);

// Dates at the precision the published record carries (whole seconds).
bool sameWholeSecond(double a, double b);

}  // namespace kolt

#endif  // KOLT_VOLUMES_VOLUME_COLLECTION_H
