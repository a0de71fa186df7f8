#pragma once
// ZUValue: the framework's dynamic value, in which bound-method arguments and results,
// memory-event values and the configuration travel between modules.
//
// A value holds nothing (Invalid), a boolean, a 32-bit integer, a 32-bit float, a
// string, an object's bytes, a binary buffer or an array of further values. It owns its
// content and copies deeply. Failures are thrown as ZUError with module "ZUValue".
//
// A value is not synchronised: one thread at a time may use it. Reading a Binary as a
// string (asString) turns it into a String in place, so even that const read counts as
// a write for this purpose.

#include <cstdint>
#include <initializer_list>
#include <string>
#include <vector>

namespace ZU {

class ZUValue;

using TZUValueString = std::string;
using TZUValueBinary = std::vector<unsigned char>;
using TZUValueArray = std::vector<ZUValue>;

class ZUValue {
 public:
  enum Type : std::int32_t {
    TypeInvalid = 0,
    TypeArray = 1,
    TypeBool = 2,
    TypeInt = 3,
    TypeFloat = 4,
    TypeString = 5,
    TypeObject = 6,
    TypeBinary = 7,
  };

  ZUValue() noexcept;
  ZUValue(const ZUValue& other);
  ZUValue(ZUValue&& other) noexcept;
  ZUValue(const TZUValueString& s);  // NOLINT(google-explicit-constructor)
  // The same as assigning: a null pointer raises "Assert failed".
  ZUValue(const char* s);  // NOLINT(google-explicit-constructor)
  ZUValue(int i);          // NOLINT(google-explicit-constructor)
  ZUValue(float f);        // NOLINT(google-explicit-constructor)
  // Narrowed to single precision.
  ZUValue(double d);  // NOLINT(google-explicit-constructor)
  // A bool would silently become an Int: build booleans with makeBool or boolRef.
  ZUValue(bool) = delete;
  virtual ~ZUValue();

  // A Bool holding b.
  static ZUValue makeBool(bool b);
  // An Array of copies of the given values.
  static ZUValue makeArray(std::initializer_list<ZUValue> elements);
  // An Object holding the given bytes.
  static ZUValue makeObject(TZUValueBinary bytes);

  ZUValue& operator=(const ZUValue& other);
  ZUValue& operator=(ZUValue&& other) noexcept;
  // A null pointer raises "Assert failed" and leaves the value unchanged.
  ZUValue& operator=(const char* s);
  ZUValue& operator=(int i);
  ZUValue& operator=(float f);
  // Narrowed to single precision.
  ZUValue& operator=(double d);
  ZUValue& operator=(bool) = delete;

  Type getType() const noexcept { return fType; }
  bool isValid() const noexcept { return fType != TypeInvalid; }
  bool isArray() const noexcept { return fType == TypeArray; }
  bool isBool() const noexcept { return fType == TypeBool; }
  bool isInt() const noexcept { return fType == TypeInt; }
  bool isFloat() const noexcept { return fType == TypeFloat; }
  bool isString() const noexcept { return fType == TypeString; }
  bool isObject() const noexcept { return fType == TypeObject; }
  bool isBinary() const noexcept { return fType == TypeBinary; }

  // Array: element count; String: length in bytes; Object, Binary: byte count; 0 for
  // the other types.
  int arraySize() const;
  // "Invalid", "Array", "Bool", "Int", "Float", "String", "Object", "Binary"; any other
  // number raises "Unknown type: " + number.
  static std::string TypeToString(int type);

  // ---- reads (the type does not change, except Binary read as a string) ----
  // Int; Bool as 0 or 1; Float truncated toward zero (saturated to the int range, NaN
  // as 0). Other types raise the type error.
  int asInt() const;
  // Bool; Int as whether it is non-zero. Other types raise the type error.
  bool asBool() const;
  // Float or Int, as a double. Other types raise the type error.
  double asFloat() const;
  // String; a Binary of fewer than 100000 bytes is first turned into a String in place
  // (with a warning on standard output). Other types raise the type error.
  const TZUValueString& asString() const;
  // Binary only.
  const TZUValueBinary& asBinary() const;
  // Array only; i must be below arraySize.
  const ZUValue& operator[](int i) const;
  // Empties `out` and appends the String elements of this Array; a non-String element
  // is reported on standard output and skipped, or appended as "" with insertEmpty.
  void ToStringArray(std::vector<std::string>& out, bool insertEmpty = false) const;

  // ---- mutable accessors (an Invalid value first takes the accessor's type) ----
  // Bool; an Int is first turned into a Bool (non-zero is true).
  bool& boolRef();
  // Float; an Int is first turned into a Float.
  float& floatRef();
  TZUValueString& stringRef();
  TZUValueBinary& binaryRef();
  // Array; does not grow the array: i must be below arraySize.
  ZUValue& operator[](int i);
  // Array resized to n elements, new ones Invalid.
  void arraySetSize(int n);
  // Array grown by one element, a copy of v (v may be this value or one of its elements).
  void arrayPush(const ZUValue& v);

  // Releases the content; the value becomes Invalid.
  void clear() noexcept;

  // Textual dump: 0 empty, 1 compact ([42, 0.5, "abc"]), 2 with types and addresses,
  // 3 and more in tagged form.
  std::string toString(int verbosity = 1) const;

 private:
  // One word: the content itself, or an owned pointer to it.
  union Storage {
    bool tbool;
    std::int32_t tint;
    float tfloat;
    TZUValueString* tstring;
    TZUValueArray* tarray;
    TZUValueBinary* tbinary;  // Object and Binary
  };

  void xSwap(ZUValue& other) noexcept;
  // Turns an Invalid value into an empty value of that type.
  void xBecome(Type type);
  // The storage word as printed by the verbosity-2 dump.
  std::uintptr_t xStorageWord() const noexcept;
  void xAssertStorage(const char* method) const;
  void xAssertType(Type expected) const;
  void xAssertCompatibleType(Type expected) const;
  // A negative index raises the size error; otherwise requires an Array of at least
  // index + 1 elements.
  void xAssertIndex(int index) const;
  void xAssertArraySize(std::int64_t requiredSize) const;
  std::string xTypeErrorDescription(Type expected) const;
  void xDump(std::string& out, int verbosity) const;

  // Mutable so that a Binary can be turned into a String by a const read.
  mutable Type fType;
  mutable Storage fValue;
};

}  // namespace ZU
