#include "kolt/directory.h"

namespace kolt {

DirectoryRecord::~DirectoryRecord() = default;
DirectoryNode::~DirectoryNode() = default;

}  // namespace kolt
