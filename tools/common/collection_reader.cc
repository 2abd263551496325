// Two readers for the schema in collection_schema.h:
//  - QuickReader walks simdjson's DOM, which has validated the whole text
//    (structure, strings, UTF-8, numbers, nothing after the root). It builds
//    no text and allocates nothing per member; at the first thing it cannot
//    vouch for it gives up.
//  - CarefulReader walks the text with simdjson On-Demand through JsonDoc,
//    which places every problem at its line and names it.
// The quick one must never accept a text that the careful one refuses, nor
// read a different value; fuzz_collection_json holds it to that.
#include "tools/common/collection_reader.h"

#include <cstring>
#include <vector>

#include "tools/common/collection_schema.h"
#include "tools/common/json_doc.h"

namespace reliqa::tool {

namespace rc = kestrova::reliqaclassifier;

namespace {

// Texts longer than this go straight to the careful reader: the DOM needs
// several times the text's size.
constexpr size_t kQuickLimit = size_t{16} << 20;

class QuickReader {
 public:
  using Value = simdjson::dom::element;
  struct GiveUp {};

  QuickReader(std::string_view text, Value root) : text_(text), root_(root) {}

  template <class F>
  void root(MemberNames names, F&& onMember) {
    members(root_, MemberPath{}, names, onMember);
  }

  template <class F>
  void members(Value& v, const MemberPath& path, MemberNames names, F&& onMember) {
    simdjson::dom::object obj;
    if (v.get_object().get(obj)) throw GiveUp{};
    uint32_t seen = 0;
    size_t next = 0;  // members usually come in the same order every time
    for (simdjson::dom::key_value_pair field : obj) {
      size_t i = indexOf(names, field.key, next);
      if (i == names.size() || (seen >> i & 1) != 0) throw GiveUp{};
      seen |= uint32_t{1} << i;
      next = i + 1;
      onMember(i, field.value, path.child(field.key));
    }
    if (seen != (uint32_t{1} << names.size()) - 1) throw GiveUp{};
  }

  template <class F>
  void elements(Value& v, const MemberPath& path, F&& onElement) {
    simdjson::dom::array arr;
    if (v.get_array().get(arr)) throw GiveUp{};
    size_t i = 0;
    for (Value x : arr) onElement(x, path.item(i++));
  }

  double number(Value& v, const MemberPath&) {
    const std::optional<double> x = numbers_.read(v);
    if (!x) throw GiveUp{};
    return *x;
  }

  int64_t integer(Value& v, const MemberPath&, int64_t min, int64_t max) {
    if (v.type() != simdjson::dom::element_type::INT64) throw GiveUp{};
    int64_t i = v.get_int64().value_unsafe();
    if (i < min || i > max) throw GiveUp{};
    return i;
  }

  bool boolean(Value& v, const MemberPath&) {
    if (v.type() != simdjson::dom::element_type::BOOL) throw GiveUp{};
    return v.get_bool().value_unsafe();
  }

  void string(Value& v, const MemberPath&, std::string& out) {
    if (v.type() != simdjson::dom::element_type::STRING) throw GiveUp{};
    std::string_view s = v.get_string().value_unsafe();
    out.assign(s.data(), s.size());
  }

  bool null(Value& v, const MemberPath&) { return v.is_null(); }

 private:
  static size_t indexOf(MemberNames names, std::string_view key, size_t guess) {
    if (guess < names.size() && names[guess] == key) return guess;
    for (size_t i = 0; i < names.size(); ++i) {
      if (names[i] == key) return i;
    }
    return names.size();
  }

  std::string_view text_;
  Value root_;
  DomNumbers numbers_{text_};
};

class CarefulReader {
 public:
  using Value = simdjson::ondemand::value;

  explicit CarefulReader(JsonDoc& doc) : doc_(doc) {}

  template <class F>
  void root(MemberNames names, F&& onMember) {
    eachMember(doc_.rootObject("a collection"), nullptr, MemberPath{}, names, onMember);
    doc_.expectEnd();
  }

  template <class F>
  void members(Value& v, const MemberPath& path, MemberNames names, F&& onMember) {
    const char* at = v.raw_json_token().data();
    eachMember(doc_.getObject(v, path.text()), at, path, names, onMember);
  }

  template <class F>
  void elements(Value& v, const MemberPath& path, F&& onElement) {
    size_t index = 0;
    for (auto element : doc_.getArray(v, path.text())) {
      MemberPath p = path.item(index++);
      Value x = doc_.take(std::move(element), p.text());
      onElement(x, p);
    }
  }

  double number(Value& v, const MemberPath& p) { return doc_.getDouble(v, p.text()); }
  int64_t integer(Value& v, const MemberPath& p, int64_t min, int64_t max) {
    return doc_.getInt(v, p.text(), min, max);
  }
  bool boolean(Value& v, const MemberPath& p) { return doc_.getBool(v, p.text()); }
  void string(Value& v, const MemberPath& p, std::string& out) { out = doc_.getString(v, p.text()); }
  bool null(Value& v, const MemberPath& p) { return doc_.isNull(v, p.text()); }

 private:
  // Every member once, each one known, all of them present; `at` places the
  // message about a missing one.
  template <class F>
  void eachMember(simdjson::ondemand::object obj, const char* at, const MemberPath& path, MemberNames names,
                  F&& onMember) {
    std::vector<bool> seen(names.size(), false);
    for (auto member : obj) {
      simdjson::ondemand::field f = doc_.take(std::move(member), "");
      std::string_view key = doc_.take(f.unescaped_key(), "");
      Value v = f.value();
      MemberPath p = path.child(key);
      size_t i = 0;
      while (i < names.size() && names[i] != key) ++i;
      if (i == names.size()) {
        std::string in = path.parent == nullptr ? std::string() : " in " + path.text();
        std::string known;
        for (std::string_view n : names) (known += known.empty() ? "" : ", ").append(n);
        doc_.fail(v, "unknown member " + quoteForMessage(key) + in + " (expected: " + known + ")");
      }
      if (seen[i]) doc_.fail(v, "member " + p.text() + " appears twice");
      seen[i] = true;
      onMember(i, v, p);
    }
    for (size_t i = 0; i < names.size(); ++i) {
      if (!seen[i]) doc_.fail(at, "missing member " + path.child(names[i]).text());
    }
  }

  JsonDoc& doc_;
};

}  // namespace

bool CollectionReader::readQuickly(std::string_view json, rc::ReliqaClassifierInput& out) {
  if (json.size() > kQuickLimit) return false;
  padded_.resize(json.size() + simdjson::SIMDJSON_PADDING);
  std::memcpy(padded_.data(), json.data(), json.size());
  simdjson::dom::element root;
  if (parser_.parse(padded_.data(), json.size(), false).get(root)) return false;
  try {
    QuickReader reader(json, root);
    readCollectionWith(reader, out);
  } catch (const QuickReader::GiveUp&) {
    return false;
  }
  return true;
}

void CollectionReader::readCarefully(std::string_view json, const std::string& name, int64_t firstLine,
                                     rc::ReliqaClassifierInput& out) {
  JsonDoc doc(json, name, firstLine);
  CarefulReader reader(doc);
  readCollectionWith(reader, out);
}

void CollectionReader::read(std::string_view json, const std::string& name, int64_t firstLine,
                            rc::ReliqaClassifierInput& out) {
  if (!readQuickly(json, out)) readCarefully(json, name, firstLine, out);
}

rc::ReliqaClassifierInput parseCollection(std::string_view json, const std::string& name, int64_t firstLine) {
  rc::ReliqaClassifierInput out;
  CollectionReader().read(json, name, firstLine, out);
  return out;
}

}  // namespace reliqa::tool
