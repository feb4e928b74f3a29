// The fields that the engine itself knows the meaning of.

#ifndef QUARRY_DAEMONS_TARNELASTICD_FIELD_NAMES_H_
#define QUARRY_DAEMONS_TARNELASTICD_FIELD_NAMES_H_

namespace quarry::engine {

constexpr const char* kFieldPath = "TARNMDPath";
constexpr const char* kFieldParent = "TARNMDParent";
constexpr const char* kFieldName = "TARNMDFSName";
constexpr const char* kFieldExtension = "TARNMDExtension";
constexpr const char* kFieldIsDir = "TARNMDIsDir";
constexpr const char* kFieldSize = "TARNMDFSSize";
constexpr const char* kFieldChanged = "TARNMDFSContentChangeDate";
constexpr const char* kFieldContent = "TARNMDTextContent";

// Fields whose names begin so are bookkeeping of this product: kept, never searched.
constexpr const char* kBookkeepingPrefix = "Quarry";

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_FIELD_NAMES_H_
