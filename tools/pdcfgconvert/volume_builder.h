// Collects the sections and keys that a reader finds, converts their values,
// checks the volume as a whole and builds its property list. Both source forms
// feed the same builder, so the same content gives the same property list and
// the same checks apply to both.
#ifndef PDCFGCONVERT_VOLUME_BUILDER_H
#define PDCFGCONVERT_VOLUME_BUILDER_H

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "conversion_error.h"
#include "kolt/plist.h"
#include "volume_schema.h"

namespace pdcfgconvert {

class VolumeBuilder {
 public:
  // `syntax` only decides how messages spell sections and keys.
  explicit VolumeBuilder(Syntax syntax) : syntax_(syntax) {}

  // Starts a section at `line`; `name` is absent when the source gave none.
  // Fails for a missing, superfluous, malformed or repeated name.
  bool beginSection(const SectionDefinition& definition, std::optional<std::string_view> name,
                    int line, ConversionError* error);

  // Records `key` of the current section at `line`; `fieldTexts` holds one
  // text per field of the key, in the key's field order. Fails for a value of
  // the wrong kind or out of bounds, and for a key given twice that is not
  // repeatable. Call only after beginSection.
  bool addSetting(const KeyDefinition& key, const std::vector<std::string_view>& fieldTexts,
                  int line, ConversionError* error);

  // Applies defaults, checks the volume as a whole (required sections and
  // keys, the stripe groups, their disks and nodes, the stored volume name
  // against `volumeName`) and returns the volume's property list:
  //   "name": volumeName, "global": {...}, "disks": {name: {...}},
  //   "stripeGroups": [{"name": ..., ..., "nodes": [{"disk", "index"}]}]
  std::optional<kolt::Value> finish(std::string_view volumeName, ConversionError* error);

 private:
  struct Section {
    const SectionDefinition* definition = nullptr;
    std::string name;
    int line = 0;
    kolt::Dictionary values;
    std::map<std::string_view, std::vector<int>> keyLines;  // key name -> lines of each occurrence
  };

  std::string describe(const Section& section) const;
  std::string describe(const KeyDefinition& key) const;
  bool fail(ConversionError* error, int line, std::string message) const;
  std::optional<kolt::Value> convertField(const FieldDefinition& field, std::string_view text,
                                          std::string* problem) const;
  bool completeSection(Section& section, ConversionError* error) const;
  bool checkVolumeName(const Section& global, std::string_view volumeName,
                       ConversionError* error) const;
  bool checkStripeGroups(ConversionError* error) const;
  bool checkNodes(ConversionError* error);

  Syntax syntax_;
  std::vector<Section> sections_;                                    // in source order
  std::map<std::pair<SectionKind, std::string>, int> sectionLines_;  // kind and name -> line
};

}  // namespace pdcfgconvert

#endif  // PDCFGCONVERT_VOLUME_BUILDER_H
