#include "kolt/controller_helpers.h"

namespace kolt {

Value redactVornSecrets(const Value& document) {
  Value copy = document;
  if (copy.find("sharedSecret")) copy.set("sharedSecret", "********");
  if (Value* globals = copy.find("globals"); globals && globals->find("sharedSecret")) {
    globals->set("sharedSecret", "********");
  }
  return copy;
}

}  // namespace kolt
