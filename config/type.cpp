#include "config/type.h"

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <typeinfo>

#include "core/message.h"

namespace ox {

namespace {

std::string foldCase(std::string_view text) {
    std::string s(text);
    for (char &c : s)
        if (c >= 'A' && c <= 'Z') c = char(c - 'A' + 'a');
    return s;
}

template <typename T>
void appendInteger(T v, std::string &out) {
    char buf[16];
    auto r = std::to_chars(buf, buf + sizeof buf, v);
    out.append(buf, r.ptr);
}

void appendFloat(float v, std::string &out) {
    char buf[32];
    auto r = std::to_chars(buf, buf + sizeof buf, v);
    out.append(buf, r.ptr);
}

void appendFixed4(float v, std::string &out) {
    char buf[64];
    int n = std::snprintf(buf, sizeof buf, "%2.4f", double(v));
    if (n > 0) out.append(buf, std::min<size_t>(size_t(n), sizeof buf - 1));
}

}  // namespace

// ---- text forms -------------------------------------------------------------------------------

void valueToString(bool v, std::string &out) { out.assign(v ? "1" : "0"); }

void valueToString(int32_t v, std::string &out) {
    out.clear();
    appendInteger(v, out);
}

void valueToString(uint32_t v, std::string &out) {
    out.clear();
    appendInteger(v, out);
}

void valueToString(float v, std::string &out) {
    out.clear();
    appendFloat(v, out);
}

void valueToString(const std::string &v, std::string &out) { out.assign(v); }

/// Writes "(a, b, ...)" with each component in the text form of append.
template <typename Append, typename... T>
void tupleToString(std::string &out, Append append, T... components) {
    out.assign("(");
    bool first = true;
    ((out += first ? "" : ", ", first = false, append(components, out)), ...);
    out += ')';
}

void valueToString(const Color &v, std::string &out) {
    tupleToString(out, appendFixed4, v.r, v.g, v.b, v.a);
}

void valueToString(const RGBf &v, std::string &out) {
    tupleToString(out, appendFixed4, v.r, v.g, v.b);
}

void valueToString(const Vec2i &v, std::string &out) {
    tupleToString(out, [](int32_t c, std::string &o) { appendInteger(c, o); }, v.x, v.y);
}

void valueToString(const Vec2 &v, std::string &out) { tupleToString(out, appendFloat, v.x, v.y); }

void valueToString(const Vec3 &v, std::string &out) {
    tupleToString(out, appendFloat, v.x, v.y, v.z);
}

void valueToString(const Mtx4 &v, std::string &out) {
    out.clear();
    for (int r = 0; r < 4; ++r) {
        out += '(';
        for (int c = 0; c < 4; ++c) {
            if (c) out += ", ";
            appendFloat(v.m[r][c], out);
        }
        out += ")\n";
    }
}

// ---- type identity ----------------------------------------------------------------------------

bool sameType(const OXCTypeBase &target, const OXCTypeBase &source) {
    if (target.kind() != source.kind()) return false;
    switch (target.kind()) {
        case OXCKind::Complex:
            return target.name() == source.name();
        case OXCKind::Enum:
            return &static_cast<const OXCEnumBase &>(target).table() ==
                   &static_cast<const OXCEnumBase &>(source).table();
        case OXCKind::Vector:
            return sameType(static_cast<const OXCTypeVector &>(target).prototype(),
                            static_cast<const OXCTypeVector &>(source).prototype());
        default:
            return true;
    }
}

// ---- enumerations -----------------------------------------------------------------------------

OXCEnumTable::OXCEnumTable(std::string typeName, bool foldCase,
                           std::initializer_list<OXCEnumEntry> entries)
    : typeName_(std::move(typeName)), foldCase_(foldCase) {
    items_.reserve(entries.size());
    for (const OXCEnumEntry &e : entries) add(e.name, e.value);
}

OXCEnumTable::OXCEnumTable(std::string typeName, bool foldCase,
                           std::initializer_list<const char *> names)
    : typeName_(std::move(typeName)), foldCase_(foldCase) {
    items_.reserve(names.size());
    int32_t value = 0;
    for (const char *n : names) add(n, value++);
}

void OXCEnumTable::add(const char *name, int32_t value) {
    std::string key = foldCase_ ? foldCase(name) : std::string(name);
    auto it = std::lower_bound(items_.begin(), items_.end(), key,
                               [](const Item &i, const std::string &k) { return i.key < k; });
    if (it != items_.end() && it->key == key) return;  // the first declaration of a name wins
    items_.insert(it, Item{name, std::move(key), value});
}

int32_t OXCEnumTable::find(std::string_view name) const {
    std::string folded;
    if (foldCase_) {
        folded = foldCase(name);
        name = folded;
    }
    auto it = std::lower_bound(items_.begin(), items_.end(), name,
                               [](const Item &i, std::string_view k) { return i.key < k; });
    if (it == items_.end() || it->key != name) return -1;
    return it->value;
}

const std::string *OXCEnumTable::nameOf(int32_t value) const {
    for (const Item &i : items_)
        if (i.value == value) return &i.name;
    return nullptr;
}

bool OXCEnumBase::setFromString(std::string_view text) {
    int32_t v = table_->find(text);
    if (v == -1) return false;
    value_ = v;
    return true;
}

void OXCEnumBase::toString(std::string &out) const {
    const std::string *n = table_->nameOf(value_);
    if (n)
        out.assign(*n);
    else
        out.clear();
}

// ---- settings objects -------------------------------------------------------------------------

bool OXCComplexType::addMember(OXCTypeBase *member, std::string_view key, const char *description) {
    std::string_view k = key.empty() ? std::string_view(member->name()) : key;
    auto it = std::lower_bound(members_.begin(), members_.end(), k,
                               [](const Member &m, std::string_view x) { return m.key() < x; });
    if (it != members_.end() && it->key() == k) {
        std::string keyText(k);
        message(kMsgWarning, 1, "Error registring variable %s in container %s, it already exists",
                keyText.c_str(), name_.c_str());
        return false;
    }
    Member m{member, description, {}};
    if (!key.empty() && key != member->name()) m.key_.assign(key);
    members_.insert(it, std::move(m));
    return true;
}

const OXCComplexType::Member *OXCComplexType::findEntry(std::string_view key) const {
    auto it = std::lower_bound(members_.begin(), members_.end(), key,
                               [](const Member &m, std::string_view x) { return m.key() < x; });
    if (it == members_.end() || it->key() != key) return nullptr;
    return &*it;
}

OXCTypeBase *OXCComplexType::findMember(std::string_view key) const {
    const Member *m = findEntry(key);
    return m ? m->value : nullptr;
}

void OXCComplexType::getDocumentation(std::map<std::string, std::string> &out) const {
    out.clear();
    for (const Member &m : members_)
        if (m.description && *m.description) out.emplace(std::string(m.key()), m.description);
}

int checkDocumentation(const OXCComplexType &complex) {
    std::map<std::string, std::string> docs;
    complex.getDocumentation(docs);
    int missing = 0;
    for (const auto &m : complex.members()) {
        std::string key(m.key());
        if (docs.count(key)) continue;
        ++missing;
        messageText(kMsgWarning, 1,
                    "Attribute " + key + " in type " + complex.typeName() + " is undocumented");
    }
    return missing;
}

// ---- vectors ----------------------------------------------------------------------------------

OXCTypeVector::OXCTypeVector(OXCComplexType *owner, std::string name,
                             std::unique_ptr<OXCTypeBase> prototype, const char *description)
    : OXCTypeBase(OXCKind::Vector, std::move(name)), prototype_(std::move(prototype)) {
    OX_CHECK(prototype_ != nullptr && owner != nullptr);
    owner->addMember(this, {}, description);
}

OXCTypeVector::OXCTypeVector(std::string name, std::unique_ptr<OXCTypeBase> prototype)
    : OXCTypeBase(OXCKind::Vector, std::move(name)), prototype_(std::move(prototype)) {
    OX_CHECK(prototype_ != nullptr);
}

bool OXCTypeVector::add(const OXCTypeBase &entry) {
    if (!accepts(entry)) {
        message(kMsgWarning, 1, "Type error when assigning variable %s", entry.name().c_str());
        return false;
    }
    elements_.push_back(convert(entry));
    return true;
}

bool OXCTypeVector::append(std::unique_ptr<OXCTypeBase> entry) {
    if (!entry || !accepts(*entry)) {
        message(kMsgWarning, 1, "Type error when assigning variable %s",
                entry ? entry->name().c_str() : "");
        return false;
    }
    if (typeid(*entry) == typeid(*prototype_) && entry->name() == prototype_->name())
        elements_.push_back(std::move(entry));
    else
        elements_.push_back(convert(*entry));
    return true;
}

std::unique_ptr<OXCTypeBase> OXCTypeVector::convert(const OXCTypeBase &entry) const {
    // Entries are always made from the prototype: typed accessors rely on the C++ class of
    // every entry, which an entry of another class with the same type name would not have.
    std::unique_ptr<OXCTypeBase> e = newElement();
    copyInto(*e, entry);
    return e;
}

void OXCTypeVector::copyElementsFrom(const OXCTypeVector &other) {
    elements_.reserve(elements_.size() + other.size());
    for (const auto &e : other.elements_) elements_.push_back(e->clone());
}

void OXCTypeVector::toString(std::string &out) const {
    out.clear();
    std::string item;
    for (const auto &e : elements_) {
        e->toString(item);
        out += item;
        out += '\n';
    }
}

std::unique_ptr<OXCTypeBase> OXCTypeVector::clone() const {
    auto copy = std::make_unique<OXCTypeVector>(name_, prototype_->clone());
    copy->copyElementsFrom(*this);
    return copy;
}

// ---- assignment -------------------------------------------------------------------------------

void OXCAssignVisitor::typeError() const {
    message(kMsgWarning, 1, "Type error when assigning variable %s", source_->name().c_str());
}

void OXCAssignVisitor::visit(OXCEnumBase &value) {
    if (!sameType(value, *source_)) return typeError();
    value.setValue(static_cast<const OXCEnumBase &>(*source_).value());
}

void OXCAssignVisitor::visit(OXCComplexType &value) {
    if (source_->kind() != OXCKind::Complex) return typeError();
    const auto &source = static_cast<const OXCComplexType &>(*source_);
    for (const auto &m : source.members()) {
        OXCTypeBase *target = value.findMember(m.key());
        if (!target) {
            std::string key(m.key());
            message(kMsgWarning, 1, "Unknown target for assignment %s in complex type %s",
                    key.c_str(), value.typeName().c_str());
            continue;
        }
        OXCAssignVisitor inner(*m.value, replaceVectors_);
        target->accept(inner);
    }
}

void OXCAssignVisitor::visit(OXCTypeVector &value) {
    if (source_->kind() != OXCKind::Vector) return typeError();
    const auto &source = static_cast<const OXCTypeVector &>(*source_);
    // Check every entry first, so that a mismatch leaves the target as it was.
    for (size_t i = 0; i < source.size(); ++i)
        if (!value.accepts(source.element(i))) return typeError();
    if (replaceVectors_) value.clear();
    for (size_t i = 0; i < source.size(); ++i) value.add(source.element(i));
}

void assign(OXCTypeBase &target, const OXCTypeBase &source) {
    OXCAssignVisitor v(source, false);
    target.accept(v);
}

void copyInto(OXCTypeBase &target, const OXCTypeBase &source) {
    OXCAssignVisitor v(source, true);
    target.accept(v);
}

}  // namespace ox
