// What went wrong while reading a volume configuration, and where.
#ifndef PDCFGCONVERT_CONVERSION_ERROR_H
#define PDCFGCONVERT_CONVERSION_ERROR_H

#include <string>

namespace pdcfgconvert {

struct ConversionError {
  int line = 0;  // 1-based line in the source; 0 when no single line is at fault
  std::string message;
};

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_CONVERSION_ERROR_H
