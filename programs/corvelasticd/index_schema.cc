#include "programs/corvelasticd/index_schema.h"

#include "programs/corvelasticd/daemon_error.h"

namespace corvlumex {
namespace elasticd {
namespace {

[[noreturn]] void Bad(const std::string& what) { throw DaemonError(kCodeBadMappings, "Bad mappings: " + what); }

// The field's attribute: its own entry, else the "default" entry, else `fallback`.
Json::Value Attribute(const Json::Value& field, const Json::Value& defaults, const char* key, const Json::Value& fallback) {
  if (field.isMember(key)) return field[key];
  if (defaults.isObject() && defaults.isMember(key)) return defaults[key];
  return fallback;
}

bool BoolAttribute(const std::string& name, const Json::Value& field, const Json::Value& defaults, const char* key, bool fallback) {
  const Json::Value value = Attribute(field, defaults, key, fallback);
  if (!value.isBool()) Bad("\"" + std::string(key) + "\" of " + name + " is not a bool");
  return value.asBool();
}

std::string StringAttribute(const std::string& name, const Json::Value& field, const Json::Value& defaults, const char* key, const char* fallback) {
  const Json::Value value = Attribute(field, defaults, key, fallback);
  if (!value.isString()) Bad("\"" + std::string(key) + "\" of " + name + " is not a string");
  return value.asString();
}

}  // namespace

IndexSchema IndexSchema::FromMappings(const Json::Value& mappings) {
  if (!mappings.isObject()) Bad("not an object");
  IndexSchema schema;
  const Json::Value& id = mappings["property_id"];
  if (!id.isString() || id.asString().empty()) Bad("\"property_id\" must be a non-empty string");
  schema.property_id_ = id.asString();
  const Json::Value& defaults = mappings["default"];
  if (!defaults.isNull() && !defaults.isObject()) Bad("\"default\" is not an object");
  const Json::Value& properties = mappings["properties"];
  if (!properties.isObject()) Bad("\"properties\" is not an object");

  for (const std::string& name : properties.getMemberNames()) {
    const Json::Value& field = properties[name];
    if (!field.isObject()) Bad("property " + name + " is not an object");
    FieldSpec field_def;
    field_def.name = name;
    field_def.code = static_cast<int>(schema.fields_.size());
    field_def.in_all = BoolAttribute(name, field, defaults, "_all", true);
    field_def.stored = BoolAttribute(name, field, defaults, "stored", true);
    field_def.required = BoolAttribute(name, field, defaults, "required", false);
    const std::string type = StringAttribute(name, field, defaults, "type", "string");
    const std::string analyzer = StringAttribute(name, field, defaults, "analyzer", "corvstandard");
    bool ngram = false;
    const Json::Value preprocess = Attribute(field, defaults, "preprocess", Json::Value(Json::arrayValue));
    if (!preprocess.isArray()) Bad("\"preprocess\" of " + name + " is not an array");
    for (const Json::Value& step : preprocess) {
      // Lower-casing is part of every analyzer here; "ngram" switches on substring search.
      if (!step.isString() || (step.asString() != "tolower" && step.asString() != "ngram")) {
        Bad("unknown preprocess step " + step.toStyledString() + " of " + name);
      }
      if (step.asString() == "ngram") ngram = true;
    }
    if (analyzer == "keyword") {
      field_def.analyzer = Analyzer::kKeyword;
    } else if (analyzer == "white space") {
      field_def.analyzer = Analyzer::kWhitespace;
    } else if (analyzer == "corvstandard" || analyzer == "standard") {
      field_def.analyzer = Analyzer::kStandard;
    } else {
      Bad("unknown analyzer \"" + analyzer + "\" of " + name);
    }
    if (type == "int" || type == "double") {
      field_def.kind = FieldKind::kNumber;
      field_def.integer = type == "int";
    } else if (type == "bool") {
      field_def.kind = FieldKind::kBool;
    } else if (type == "string" || type == "text") {
      if (ngram) {
        field_def.kind = FieldKind::kNgram;
        // The words of a name are searched with the standard rules, so
        // "report" finds "Report-2023.pdf" through the catch-all field.
        field_def.analyzer = Analyzer::kStandard;
      } else {
        field_def.kind = field_def.analyzer == Analyzer::kKeyword ? FieldKind::kKeyword : FieldKind::kText;
      }
    } else {
      Bad("unknown type \"" + type + "\" of " + name);
    }
    schema.by_name_[name] = schema.fields_.size();
    schema.fields_.push_back(field_def);
  }
  const FieldSpec* key = schema.Find(schema.property_id_);
  if (key == nullptr) Bad("\"property_id\" " + schema.property_id_ + " is not a property");
  if (key->kind != FieldKind::kKeyword) Bad("\"property_id\" " + schema.property_id_ + " must be a keyword string field");
  return schema;
}

const FieldSpec* IndexSchema::Find(const std::string& name) const {
  const auto it = by_name_.find(name);
  return it == by_name_.end() ? nullptr : &fields_[it->second];
}

const FieldSpec* IndexSchema::FindCode(int code) const {
  if (code < 0 || static_cast<size_t>(code) >= fields_.size()) return nullptr;
  return &fields_[static_cast<size_t>(code)];
}

std::vector<const FieldSpec*> IndexSchema::TextFields() const {
  std::vector<const FieldSpec*> out;
  for (const FieldSpec& field : fields_) {
    if (field.HasTextColumn() && field.name != property_id_) out.push_back(&field);
  }
  return out;
}

std::vector<const FieldSpec*> IndexSchema::NgramFields() const {
  std::vector<const FieldSpec*> out;
  for (const FieldSpec& field : fields_) {
    if (field.kind == FieldKind::kNgram) out.push_back(&field);
  }
  return out;
}

}  // namespace elasticd
}  // namespace corvlumex
