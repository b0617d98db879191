#pragma once

#include <cstdint>
#include <initializer_list>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "core/check.h"
#include "core/types.h"

/// Typed, self-describing settings values: scalars, enumerations, settings objects (complex
/// values with a member registry), vectors, the visitors over them and assignment by name.
///
/// Declaring a settings class (members are registered by their constructors, in order):
///
///     enum class TileSchemeType : int32_t { Hilbert, LeftToRight, Concentric, Random };
///     OX_ENUM_NAMES(TileSchemeType, "TileSchemeType", "Hilbert", "LeftToRight", ...);
///
///     class FrameSettingsBase : public ox::OXCComplexType {
///     public:
///         FrameSettingsBase() : OXCComplexType("FrameSettings") {}
///         ox::OXCType<ox::Vec2i> resolution{this, "resolution", {640, 480}, "Resolution ..."};
///         ox::OXCEnum<TileSchemeType> tileScheme{this, "tileScheme", TileSchemeType::Hilbert,
///                                               "Tile selection scheme"};
///         ox::OXCNested<OutputCorrectionBase> outputCorrection{this, "", "Output color ..."};
///         ox::OXCTypedVector<std::string> names{this, "names", "Some names"};
///         ox::OXCTypedComplexVector<BakeTargetBase> targets{this, "targets", "Bake targets"};
///     };
///     using FrameSettings = ox::OXCComplexTypeInstantiator<FrameSettingsBase>;
namespace ox {

/// Three-component colour without alpha (the `_RGB<float>` value type of settings).
template <typename T>
struct RGB {
    T r = 0, g = 0, b = 0;

    constexpr RGB() = default;
    constexpr RGB(T r_, T g_, T b_) : r(r_), g(g_), b(b_) {}
    bool operator==(const RGB &o) const = default;
};
/// The float colour triple used by settings.
using RGBf = RGB<float>;

class OXCTypeBase;
template <typename T>
class OXCType;
class OXCEnumBase;
class OXCComplexType;
class OXCTypeVector;

/// The fourteen kinds of typed values, in visitor order.
enum class OXCKind : uint8_t {
    Mtx4,
    Enum,
    Complex,
    Vector,
    Vec3,
    Vec2f,
    Vec2i,
    RGB,
    Color,
    String,
    Float,
    Bool,
    UInt,
    Int,
};

/// Maps a scalar value type to its kind; only the eleven value types have one.
template <typename T>
struct OXCKindOf;
template <>
struct OXCKindOf<Mtx4> {
    static constexpr OXCKind kKind = OXCKind::Mtx4;
};
template <>
struct OXCKindOf<Vec3> {
    static constexpr OXCKind kKind = OXCKind::Vec3;
};
template <>
struct OXCKindOf<Vec2> {
    static constexpr OXCKind kKind = OXCKind::Vec2f;
};
template <>
struct OXCKindOf<Vec2i> {
    static constexpr OXCKind kKind = OXCKind::Vec2i;
};
template <>
struct OXCKindOf<RGBf> {
    static constexpr OXCKind kKind = OXCKind::RGB;
};
template <>
struct OXCKindOf<Color> {
    static constexpr OXCKind kKind = OXCKind::Color;
};
template <>
struct OXCKindOf<std::string> {
    static constexpr OXCKind kKind = OXCKind::String;
};
template <>
struct OXCKindOf<float> {
    static constexpr OXCKind kKind = OXCKind::Float;
};
template <>
struct OXCKindOf<bool> {
    static constexpr OXCKind kKind = OXCKind::Bool;
};
template <>
struct OXCKindOf<uint32_t> {
    static constexpr OXCKind kKind = OXCKind::UInt;
};
template <>
struct OXCKindOf<int32_t> {
    static constexpr OXCKind kKind = OXCKind::Int;
};

/// Visitor over mutable values: one operation per kind.
class OXCTypeVisitor {
public:
    virtual ~OXCTypeVisitor() = default;
    virtual void visit(OXCType<Mtx4> &value) = 0;
    virtual void visit(OXCEnumBase &value) = 0;
    virtual void visit(OXCComplexType &value) = 0;
    virtual void visit(OXCTypeVector &value) = 0;
    virtual void visit(OXCType<Vec3> &value) = 0;
    virtual void visit(OXCType<Vec2> &value) = 0;
    virtual void visit(OXCType<Vec2i> &value) = 0;
    virtual void visit(OXCType<RGBf> &value) = 0;
    virtual void visit(OXCType<Color> &value) = 0;
    virtual void visit(OXCType<std::string> &value) = 0;
    virtual void visit(OXCType<float> &value) = 0;
    virtual void visit(OXCType<bool> &value) = 0;
    virtual void visit(OXCType<uint32_t> &value) = 0;
    virtual void visit(OXCType<int32_t> &value) = 0;
};

/// Visitor over read-only values: one operation per kind.
class OXCTypeVisitorConst {
public:
    virtual ~OXCTypeVisitorConst() = default;
    virtual void visit(const OXCType<Mtx4> &value) = 0;
    virtual void visit(const OXCEnumBase &value) = 0;
    virtual void visit(const OXCComplexType &value) = 0;
    virtual void visit(const OXCTypeVector &value) = 0;
    virtual void visit(const OXCType<Vec3> &value) = 0;
    virtual void visit(const OXCType<Vec2> &value) = 0;
    virtual void visit(const OXCType<Vec2i> &value) = 0;
    virtual void visit(const OXCType<RGBf> &value) = 0;
    virtual void visit(const OXCType<Color> &value) = 0;
    virtual void visit(const OXCType<std::string> &value) = 0;
    virtual void visit(const OXCType<float> &value) = 0;
    virtual void visit(const OXCType<bool> &value) = 0;
    virtual void visit(const OXCType<uint32_t> &value) = 0;
    virtual void visit(const OXCType<int32_t> &value) = 0;
};

/// Abstract base of every typed value: a name and a kind. Never copied or moved (settings
/// objects hold pointers into themselves); copies go through clone() or assign().
class OXCTypeBase {
public:
    OXCTypeBase(const OXCTypeBase &) = delete;
    OXCTypeBase &operator=(const OXCTypeBase &) = delete;
    virtual ~OXCTypeBase() = default;

    /// The value's name; for a settings object its type name.
    const std::string &name() const { return name_; }
    /// The kind of the value (fixed at construction).
    OXCKind kind() const { return kind_; }

    /// Writes the value as text into out (replacing its content).
    virtual void toString(std::string &out) const = 0;
    /// The value as text.
    std::string toString() const {
        std::string s;
        toString(s);
        return s;
    }
    /// Calls the visitor's operation for this kind.
    virtual void accept(OXCTypeVisitor &visitor) = 0;
    /// Calls the read-only visitor's operation for this kind.
    virtual void accept(OXCTypeVisitorConst &visitor) const = 0;
    /// A new value of the same type, name and content, owned by the caller.
    virtual std::unique_ptr<OXCTypeBase> clone() const = 0;

protected:
    OXCTypeBase(OXCKind kind, std::string name) : name_(std::move(name)), kind_(kind) {}

    std::string name_;

private:
    OXCKind kind_;
};

/// True when a value of `source`'s type can be stored in `target` (same kind; same type name
/// for settings objects; same table for enumerations; same element type for vectors).
bool sameType(const OXCTypeBase &target, const OXCTypeBase &source);

/// Text forms of the value types (toString of OXCType<T>).
void valueToString(bool v, std::string &out);
void valueToString(int32_t v, std::string &out);
void valueToString(uint32_t v, std::string &out);
/// Shortest text that reads back to the same float.
void valueToString(float v, std::string &out);
void valueToString(const std::string &v, std::string &out);
void valueToString(const Color &v, std::string &out);
void valueToString(const RGBf &v, std::string &out);
void valueToString(const Vec2i &v, std::string &out);
void valueToString(const Vec2 &v, std::string &out);
void valueToString(const Vec3 &v, std::string &out);
void valueToString(const Mtx4 &v, std::string &out);

/// A scalar or small aggregate value of one of the eleven value types.
template <typename T>
class OXCType final : public OXCTypeBase {
public:
    using ValueType = T;

    /// A member of `owner`, registered under `name` with a description (a string literal).
    OXCType(OXCComplexType *owner, std::string name, T defaultValue, const char *description);
    /// A free-standing value (vector prototypes, clones, tests).
    OXCType(std::string name, T defaultValue)
        : OXCTypeBase(OXCKindOf<T>::kKind, std::move(name)), value_(std::move(defaultValue)) {}

    /// The current value.
    const T &get() const { return value_; }
    /// The current value.
    const T &operator()() const { return value_; }
    /// The current value.
    operator const T &() const { return value_; }
    /// Mutable access to the value.
    T &ref() { return value_; }
    /// Replaces the value.
    void set(T v) { value_ = std::move(v); }
    /// Replaces the value.
    OXCType &operator=(T v) {
        value_ = std::move(v);
        return *this;
    }

    using OXCTypeBase::toString;
    void toString(std::string &out) const override { valueToString(value_, out); }
    void accept(OXCTypeVisitor &visitor) override { visitor.visit(*this); }
    void accept(OXCTypeVisitorConst &visitor) const override { visitor.visit(*this); }
    std::unique_ptr<OXCTypeBase> clone() const override {
        return std::make_unique<OXCType<T>>(name_, value_);
    }

private:
    T value_;
};

/// One (name, value) pair of an enumeration table.
struct OXCEnumEntry {
    const char *name;
    int32_t value;
};

/// The names of one enumeration type; made once per C++ enumeration type, kept for the process.
class OXCEnumTable {
public:
    /// A table entry: the name as declared, the lookup key (lower case when folding) and value.
    struct Item {
        std::string name;
        std::string key;
        int32_t value;
    };

    /// Builds the table; duplicate names keep the first entry.
    OXCEnumTable(std::string typeName, bool foldCase, std::initializer_list<OXCEnumEntry> entries);
    /// Builds a table whose values are the positions of the names (0, 1, 2, ...).
    OXCEnumTable(std::string typeName, bool foldCase, std::initializer_list<const char *> names);
    OXCEnumTable(const OXCEnumTable &) = delete;
    OXCEnumTable &operator=(const OXCEnumTable &) = delete;

    /// The enumeration's type name (for example "RenderType").
    const std::string &typeName() const { return typeName_; }
    /// True when names match regardless of case.
    bool foldsCase() const { return foldCase_; }
    /// The value of a name; -1 when the table has no such name.
    int32_t find(std::string_view name) const;
    /// The first name (in name order) with this value, or nullptr.
    const std::string *nameOf(int32_t value) const;
    /// Entries ordered by key (byte order).
    const std::vector<Item> &items() const { return items_; }

private:
    void add(const char *name, int32_t value);

    std::string typeName_;
    bool foldCase_;
    std::vector<Item> items_;
};

/// An enumeration value: an int32 and the shared table of its names.
class OXCEnumBase : public OXCTypeBase {
public:
    /// The value as an integer.
    int32_t value() const { return value_; }
    /// Sets the value as an integer (never -1).
    void setValue(int32_t v) {
        OX_CHECK(v != -1);
        value_ = v;
    }
    /// The shared table of names.
    const OXCEnumTable &table() const { return *table_; }
    /// Sets the value from a name (case folded when the table asks); false keeps the value.
    bool setFromString(std::string_view text);

    using OXCTypeBase::toString;
    void toString(std::string &out) const override;
    void accept(OXCTypeVisitor &visitor) override { visitor.visit(*this); }
    void accept(OXCTypeVisitorConst &visitor) const override { visitor.visit(*this); }

protected:
    OXCEnumBase(std::string name, const OXCEnumTable &table, int32_t value)
        : OXCTypeBase(OXCKind::Enum, std::move(name)), table_(&table), value_(value) {
        OX_CHECK(value != -1);
    }

private:
    const OXCEnumTable *table_;
    int32_t value_;
};

/// An enumeration value of the C++ enumeration E, whose table is declared with OX_ENUM_NAMES
/// or OX_ENUM_VALUES beside E.
template <typename E>
class OXCEnum final : public OXCEnumBase {
public:
    /// A member of `owner`, registered under `name` with a description (a string literal).
    OXCEnum(OXCComplexType *owner, std::string name, E defaultValue, const char *description);
    /// A free-standing value.
    OXCEnum(std::string name, E defaultValue)
        : OXCEnumBase(std::move(name), oxcEnumTable(static_cast<E *>(nullptr)),
                      static_cast<int32_t>(defaultValue)) {}

    /// The current value.
    E get() const { return static_cast<E>(value()); }
    /// The current value.
    E operator()() const { return get(); }
    /// The current value.
    operator E() const { return get(); }
    /// Replaces the value.
    void set(E v) { setValue(static_cast<int32_t>(v)); }
    /// Replaces the value.
    OXCEnum &operator=(E v) {
        set(v);
        return *this;
    }

    std::unique_ptr<OXCTypeBase> clone() const override {
        return std::make_unique<OXCEnum<E>>(name_, get());
    }
};

/// Declares the table of enumeration E (written beside E, in E's namespace): its type name and
/// its names, whose values are their positions. Names match exactly.
#define OX_ENUM_NAMES(E, typeName, ...)                                        \
    inline const ::ox::OXCEnumTable &oxcEnumTable(E *) {                       \
        static const ::ox::OXCEnumTable table(typeName, false, {__VA_ARGS__}); \
        return table;                                                          \
    }                                                                          \
    static_assert(true)
/// As OX_ENUM_NAMES, with names that match regardless of case.
#define OX_ENUM_NAMES_FOLD(E, typeName, ...)                                  \
    inline const ::ox::OXCEnumTable &oxcEnumTable(E *) {                      \
        static const ::ox::OXCEnumTable table(typeName, true, {__VA_ARGS__}); \
        return table;                                                         \
    }                                                                         \
    static_assert(true)
/// Declares the table of enumeration E with explicit values: {"Adaptive", 1}, ...
#define OX_ENUM_VALUES(E, typeName, ...)                                              \
    inline const ::ox::OXCEnumTable &oxcEnumTable(E *) {                              \
        static const ::ox::OXCEnumTable table(                                        \
            typeName, false, std::initializer_list<::ox::OXCEnumEntry>{__VA_ARGS__}); \
        return table;                                                                 \
    }                                                                                 \
    static_assert(true)

/// The table of enumeration E.
template <typename E>
const OXCEnumTable &enumTable() {
    return oxcEnumTable(static_cast<E *>(nullptr));
}

/// A settings object (or scene object): a complex value whose members register themselves by
/// name. Derive from it, pass the type name, declare members as fields; use the class through
/// OXCComplexTypeInstantiator (or OXCNested inside another settings class).
class OXCComplexType : public OXCTypeBase {
public:
    /// One registry entry.
    struct Member {
        /// The key (element name) of the member.
        std::string_view key() const { return key_.empty() ? value->name() : key_; }
        OXCTypeBase *value;
        const char *description;  // nullptr when undocumented
        std::string key_;         // empty: the member's own name is the key
    };

    /// Registers a member under `key` (empty: its own name). A key that is taken warns
    /// "Error registring variable %s in container %s, it already exists" and returns false.
    bool addMember(OXCTypeBase *member, std::string_view key = {},
                   const char *description = nullptr);
    /// The member registered under `key`, or nullptr.
    OXCTypeBase *findMember(std::string_view key) const;
    /// The registry entry of `key`, or nullptr.
    const Member *findEntry(std::string_view key) const;
    /// All members in ascending key order.
    const std::vector<Member> &members() const { return members_; }
    /// The type name (same as name()).
    const std::string &typeName() const { return name_; }

    /// Fills `out` with member key -> description; the default takes the descriptions given at
    /// registration. Classes may override to add or change texts.
    virtual void getDocumentation(std::map<std::string, std::string> &out) const;

    using OXCTypeBase::toString;
    void toString(std::string &out) const override { out.clear(); }
    void accept(OXCTypeVisitor &visitor) override { visitor.visit(*this); }
    void accept(OXCTypeVisitorConst &visitor) const override { visitor.visit(*this); }

protected:
    /// `typeName` is the settings object's type and element name (for example "FrameSettings").
    explicit OXCComplexType(std::string typeName)
        : OXCTypeBase(OXCKind::Complex, std::move(typeName)) {}

private:
    std::vector<Member> members_;  // sorted by key
};

/// The member registered under `name` in `complex`, or nullptr.
inline OXCTypeBase *findMember(const OXCComplexType &complex, std::string_view name) {
    return complex.findMember(name);
}
/// Registers `member` in `complex` under `name` (empty: the member's own name).
inline bool addMember(OXCComplexType &complex, OXCTypeBase &member, std::string_view name = {},
                      const char *description = nullptr) {
    return complex.addMember(&member, name, description);
}
/// Reports every member without documentation: "Attribute %s in type %s is undocumented".
/// Returns the number of undocumented members.
int checkDocumentation(const OXCComplexType &complex);

/// Copies `source` into `target` by name (vectors append).
void assign(OXCTypeBase &target, const OXCTypeBase &source);
/// Makes `target` equal to `source`: as assign, but vectors are replaced, not appended to.
void copyInto(OXCTypeBase &target, const OXCTypeBase &source);

/// Makes the settings class T concrete: supplies clone (a new T filled by copyInto).
template <typename T>
class OXCComplexTypeInstantiator : public T {
public:
    using T::T;
    OXCComplexTypeInstantiator() = default;

    std::unique_ptr<OXCTypeBase> clone() const override {
        auto copy = std::make_unique<OXCComplexTypeInstantiator<T>>();
        copyInto(*copy, *this);
        return copy;
    }
};

/// A settings object nested in another: OXCNested<OutputCorrectionBase> m{this, "", "text"}
/// registers it in the owner under the key (empty: its type name).
template <typename T>
class OXCNested final : public OXCComplexTypeInstantiator<T> {
public:
    /// Registers the nested object in `owner` under `key` with a description.
    OXCNested(OXCComplexType *owner, std::string_view key, const char *description) {
        OX_CHECK(owner != nullptr);
        owner->addMember(this, key, description);
    }
};

/// A vector of owned values of one element type, described by its prototype entry.
class OXCTypeVector : public OXCTypeBase {
public:
    /// A member of `owner` holding clones of `prototype` (a free-standing value).
    OXCTypeVector(OXCComplexType *owner, std::string name, std::unique_ptr<OXCTypeBase> prototype,
                  const char *description);
    /// A free-standing vector.
    OXCTypeVector(std::string name, std::unique_ptr<OXCTypeBase> prototype);

    /// Number of entries.
    size_t size() const { return elements_.size(); }
    /// True when there are no entries.
    bool empty() const { return elements_.empty(); }
    /// Entry i.
    OXCTypeBase &element(size_t i) { return *elements_[i]; }
    /// Entry i.
    const OXCTypeBase &element(size_t i) const { return *elements_[i]; }
    /// The prototype: new entries for reading start as its clones.
    const OXCTypeBase &prototype() const { return *prototype_; }
    /// A new entry with the element type's defaults (a clone of the prototype).
    std::unique_ptr<OXCTypeBase> newElement() const { return prototype_->clone(); }
    /// True when `entry` has the element type.
    bool accepts(const OXCTypeBase &entry) const { return sameType(*prototype_, entry); }
    /// Appends a clone of `entry` (the caller keeps its own); false (and a warning) when the
    /// entry has another type.
    bool add(const OXCTypeBase &entry);
    /// Appends an entry made by newElement() or clone(); false when it has another type.
    bool append(std::unique_ptr<OXCTypeBase> entry);
    /// Removes every entry.
    void clear() { elements_.clear(); }

    using OXCTypeBase::toString;
    void toString(std::string &out) const override;
    void accept(OXCTypeVisitor &visitor) override { visitor.visit(*this); }
    void accept(OXCTypeVisitorConst &visitor) const override { visitor.visit(*this); }
    std::unique_ptr<OXCTypeBase> clone() const override;

protected:
    /// A new entry of the prototype's class holding the content of `entry` (same type).
    std::unique_ptr<OXCTypeBase> convert(const OXCTypeBase &entry) const;
    /// Deep copy of the entries of `other` (same element type) into this vector.
    void copyElementsFrom(const OXCTypeVector &other);

    std::vector<std::unique_ptr<OXCTypeBase>> elements_;
    std::unique_ptr<OXCTypeBase> prototype_;
};

/// A vector of scalar values (in use: strings); entries are named "element".
template <typename T>
class OXCTypedVector final : public OXCTypeVector {
public:
    /// A member of `owner` registered under `name` with a description (a string literal).
    OXCTypedVector(OXCComplexType *owner, std::string name, const char *description)
        : OXCTypeVector(owner, std::move(name), std::make_unique<OXCType<T>>("element", T{}),
                        description) {}
    /// A free-standing vector.
    explicit OXCTypedVector(std::string name)
        : OXCTypeVector(std::move(name), std::make_unique<OXCType<T>>("element", T{})) {}

    /// Value of entry i.
    const T &operator[](size_t i) const {
        return static_cast<const OXCType<T> &>(*elements_[i]).get();
    }
    /// Mutable value of entry i.
    T &ref(size_t i) { return static_cast<OXCType<T> &>(*elements_[i]).ref(); }
    /// Appends a value.
    void push(T v) { elements_.push_back(std::make_unique<OXCType<T>>("element", std::move(v))); }
    /// All values in order.
    std::vector<T> values() const {
        std::vector<T> out;
        out.reserve(size());
        for (size_t i = 0; i < size(); ++i) out.push_back((*this)[i]);
        return out;
    }

    std::unique_ptr<OXCTypeBase> clone() const override {
        auto copy = std::make_unique<OXCTypedVector<T>>(name_);
        copy->copyElementsFrom(*this);
        return copy;
    }
};

/// A vector of settings objects of class T (used through its instantiator); entries are
/// written under T's type name.
template <typename T>
class OXCTypedComplexVector final : public OXCTypeVector {
public:
    using Element = OXCComplexTypeInstantiator<T>;

    /// A member of `owner` registered under `name` with a description (a string literal).
    OXCTypedComplexVector(OXCComplexType *owner, std::string name, const char *description)
        : OXCTypeVector(owner, std::move(name), std::make_unique<Element>(), description) {}
    /// A free-standing vector.
    explicit OXCTypedComplexVector(std::string name)
        : OXCTypeVector(std::move(name), std::make_unique<Element>()) {}

    /// Entry i.
    T &operator[](size_t i) { return static_cast<Element &>(*elements_[i]); }
    /// Entry i.
    const T &operator[](size_t i) const { return static_cast<const Element &>(*elements_[i]); }
    using OXCTypeVector::append;
    /// Appends a new entry with defaults and returns it.
    T &append() {
        elements_.push_back(std::make_unique<Element>());
        return static_cast<Element &>(*elements_.back());
    }

    std::unique_ptr<OXCTypeBase> clone() const override {
        auto copy = std::make_unique<OXCTypedComplexVector<T>>(name_);
        copy->copyElementsFrom(*this);
        return copy;
    }
};

/// Copies a source value into each visited target (see assign()).
class OXCAssignVisitor final : public OXCTypeVisitor {
public:
    /// `source` is not owned; with replaceVectors, vectors are replaced instead of appended to.
    explicit OXCAssignVisitor(const OXCTypeBase &source, bool replaceVectors = false)
        : source_(&source), replaceVectors_(replaceVectors) {}

    void visit(OXCType<Mtx4> &value) override { assignScalar(value); }
    void visit(OXCEnumBase &value) override;
    void visit(OXCComplexType &value) override;
    void visit(OXCTypeVector &value) override;
    void visit(OXCType<Vec3> &value) override { assignScalar(value); }
    void visit(OXCType<Vec2> &value) override { assignScalar(value); }
    void visit(OXCType<Vec2i> &value) override { assignScalar(value); }
    void visit(OXCType<RGBf> &value) override { assignScalar(value); }
    void visit(OXCType<Color> &value) override { assignScalar(value); }
    void visit(OXCType<std::string> &value) override { assignScalar(value); }
    void visit(OXCType<float> &value) override { assignScalar(value); }
    void visit(OXCType<bool> &value) override { assignScalar(value); }
    void visit(OXCType<uint32_t> &value) override { assignScalar(value); }
    void visit(OXCType<int32_t> &value) override { assignScalar(value); }

private:
    template <typename T>
    void assignScalar(OXCType<T> &target) {
        if (source_->kind() == target.kind())
            target.set(static_cast<const OXCType<T> &>(*source_).get());
        else
            typeError();
    }
    void typeError() const;

    const OXCTypeBase *source_;
    bool replaceVectors_;
};

template <typename T>
OXCType<T>::OXCType(OXCComplexType *owner, std::string name, T defaultValue,
                    const char *description)
    : OXCTypeBase(OXCKindOf<T>::kKind, std::move(name)), value_(std::move(defaultValue)) {
    OX_CHECK(owner != nullptr);
    owner->addMember(this, {}, description);
}

template <typename E>
OXCEnum<E>::OXCEnum(OXCComplexType *owner, std::string name, E defaultValue,
                    const char *description)
    : OXCEnumBase(std::move(name), oxcEnumTable(static_cast<E *>(nullptr)),
                  static_cast<int32_t>(defaultValue)) {
    OX_CHECK(owner != nullptr);
    owner->addMember(this, {}, description);
}

}  // namespace ox
