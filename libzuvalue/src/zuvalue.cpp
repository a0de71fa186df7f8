#include "zu/zuvalue.h"

#include <bit>
#include <cinttypes>
#include <climits>
#include <cmath>
#include <cstdio>
#include <utility>

#include "zu/zuerror.h"

namespace ZU {

namespace {

constexpr const char* kModule = "ZUValue";
// A Binary of this size or more is not turned into a String by a read.
constexpr std::size_t kMaxBinaryReadAsString = 100000;
constexpr std::size_t kStringReserve = 64;
constexpr std::size_t kArrayReserve = 32;
constexpr std::size_t kBinaryReserve = 1024;

const char* const kTypeNames[] = {"Invalid", "Array",  "Bool",   "Int",
                                  "Float",   "String", "Object", "Binary"};

// Zero-padded uppercase hexadecimal of pointer width.
std::string pointerHex(std::uintptr_t word) {
  char buf[2 * sizeof(std::uintptr_t) + 1];
  std::snprintf(buf, sizeof buf, "%0*" PRIXPTR, static_cast<int>(2 * sizeof(std::uintptr_t)), word);
  return buf;
}

int sizeAsInt(std::size_t size) {
  return size > static_cast<std::size_t>(INT_MAX) ? INT_MAX : static_cast<int>(size);
}

}  // namespace

ZUValue::ZUValue() noexcept : fType(TypeInvalid), fValue{} {}

ZUValue::ZUValue(const ZUValue& other) : fType(TypeInvalid), fValue{} {
  Storage copy{};
  switch (other.fType) {
    case TypeArray:
      copy.tarray = new TZUValueArray(*other.fValue.tarray);
      break;
    case TypeString:
      copy.tstring = new TZUValueString(*other.fValue.tstring);
      break;
    case TypeObject:
    case TypeBinary:
      copy.tbinary = new TZUValueBinary(*other.fValue.tbinary);
      break;
    default:
      copy = other.fValue;
      break;
  }
  fValue = copy;
  fType = other.fType;
}

ZUValue::ZUValue(ZUValue&& other) noexcept : fType(other.fType), fValue(other.fValue) {
  other.fType = TypeInvalid;
  other.fValue = Storage{};
}

ZUValue::ZUValue(const TZUValueString& s) : fType(TypeInvalid), fValue{} {
  fValue.tstring = new TZUValueString(s);
  fType = TypeString;
}

ZUValue::ZUValue(const char* s) : ZUValue() {
  *this = s;
}

ZUValue::ZUValue(int i) : fType(TypeInt), fValue{} {
  fValue.tint = i;
}

ZUValue::ZUValue(float f) : fType(TypeFloat), fValue{} {
  fValue.tfloat = f;
}

ZUValue::ZUValue(double d) : ZUValue(static_cast<float>(d)) {}

ZUValue::~ZUValue() {
  clear();
}

ZUValue ZUValue::makeBool(bool b) {
  ZUValue v;
  v.boolRef() = b;
  return v;
}

ZUValue ZUValue::makeArray(std::initializer_list<ZUValue> elements) {
  ZUValue v;
  v.xBecome(TypeArray);
  v.fValue.tarray->assign(elements.begin(), elements.end());
  return v;
}

ZUValue ZUValue::makeObject(TZUValueBinary bytes) {
  ZUValue v;
  v.fValue.tbinary = new TZUValueBinary(std::move(bytes));
  v.fType = TypeObject;
  return v;
}

ZUValue& ZUValue::operator=(const ZUValue& other) {
  if (this != &other) {
    ZUValue copy(other);
    xSwap(copy);
  }
  return *this;
}

ZUValue& ZUValue::operator=(ZUValue&& other) noexcept {
  if (this != &other) {
    ZUValue taken(std::move(other));
    xSwap(taken);
  }
  return *this;
}

ZUValue& ZUValue::operator=(const char* s) {
  if (s == nullptr)
    ZU_THROW_ERROR(kModule, "operator=", "Assert failed");
  if (fType == TypeString) {
    fValue.tstring->assign(s);
  } else {
    // Built before the old content goes: s may point into it.
    ZUValue str;
    str.xBecome(TypeString);
    str.fValue.tstring->assign(s);
    xSwap(str);
  }
  return *this;
}

ZUValue& ZUValue::operator=(int i) {
  clear();
  fValue.tint = i;
  fType = TypeInt;
  return *this;
}

ZUValue& ZUValue::operator=(float f) {
  clear();
  fValue.tfloat = f;
  fType = TypeFloat;
  return *this;
}

ZUValue& ZUValue::operator=(double d) {
  return *this = static_cast<float>(d);
}

void ZUValue::xSwap(ZUValue& other) noexcept {
  std::swap(fType, other.fType);
  std::swap(fValue, other.fValue);
}

void ZUValue::clear() noexcept {
  switch (fType) {
    case TypeArray:
      delete fValue.tarray;
      break;
    case TypeString:
      delete fValue.tstring;
      break;
    case TypeObject:
    case TypeBinary:
      delete fValue.tbinary;
      break;
    default:
      break;
  }
  fType = TypeInvalid;
  fValue = Storage{};
}

void ZUValue::xBecome(Type type) {
  Storage content{};
  switch (type) {
    case TypeArray:
      content.tarray = new TZUValueArray();
      content.tarray->reserve(kArrayReserve);
      break;
    case TypeString:
      content.tstring = new TZUValueString();
      content.tstring->reserve(kStringReserve);
      break;
    case TypeObject:
      content.tbinary = new TZUValueBinary();
      break;
    case TypeBinary:
      content.tbinary = new TZUValueBinary();
      content.tbinary->reserve(kBinaryReserve);
      break;
    default:
      break;
  }
  clear();
  fValue = content;
  fType = type;
}

int ZUValue::arraySize() const {
  switch (fType) {
    case TypeArray:
      xAssertStorage("arraySize");
      return sizeAsInt(fValue.tarray->size());
    case TypeString:
      xAssertStorage("arraySize");
      return sizeAsInt(fValue.tstring->size());
    case TypeObject:
    case TypeBinary:
      xAssertStorage("arraySize");
      return sizeAsInt(fValue.tbinary->size());
    default:
      return 0;
  }
}

std::string ZUValue::TypeToString(int type) {
  if (type < TypeInvalid || type > TypeBinary) {
    ZU_THROW_ERROR(kModule, "TypeToString", "Unknown type: " + std::to_string(type));
  }
  return kTypeNames[type];
}

int ZUValue::asInt() const {
  switch (fType) {
    case TypeInt:
      return fValue.tint;
    case TypeBool:
      return fValue.tbool ? 1 : 0;
    case TypeFloat: {
      const float f = fValue.tfloat;
      if (std::isnan(f))
        return 0;
      if (f >= 2147483648.0f)
        return INT_MAX;
      if (f < -2147483648.0f)
        return INT_MIN;
      return static_cast<int>(f);
    }
    default:
      xAssertType(TypeInt);
      return 0;
  }
}

bool ZUValue::asBool() const {
  if (fType == TypeInt)
    return fValue.tint != 0;
  xAssertType(TypeBool);
  return fValue.tbool;
}

double ZUValue::asFloat() const {
  if (fType == TypeInt)
    return static_cast<double>(fValue.tint);
  xAssertType(TypeFloat);
  return static_cast<double>(fValue.tfloat);
}

const TZUValueString& ZUValue::asString() const {
  if (fType == TypeBinary) {
    xAssertStorage("operator const TZUValueString&");
    const TZUValueBinary& bytes = *fValue.tbinary;
    if (bytes.size() < kMaxBinaryReadAsString) {
      std::printf(
          "WARNING: ZUValue::operator const TZUValueString&: creating a string on the fly to "
          "patch possible ruby encoding problem (size of binary: %d)\n",
          static_cast<int>(bytes.size()));
      std::fflush(stdout);
      auto* str = new TZUValueString(bytes.begin(), bytes.end());
      delete fValue.tbinary;
      fValue.tstring = str;
      fType = TypeString;
    }
  }
  xAssertType(TypeString);
  xAssertStorage("operator const TZUValueString&");
  return *fValue.tstring;
}

const TZUValueBinary& ZUValue::asBinary() const {
  xAssertType(TypeBinary);
  xAssertStorage("asBinary");
  return *fValue.tbinary;
}

const ZUValue& ZUValue::operator[](int i) const {
  xAssertType(TypeArray);
  xAssertIndex(i);
  return (*fValue.tarray)[static_cast<std::size_t>(i)];
}

void ZUValue::ToStringArray(std::vector<std::string>& out, bool insertEmpty) const {
  xAssertType(TypeArray);
  xAssertStorage("ToStringArray");
  const TZUValueArray& elements = *fValue.tarray;
  out.clear();
  out.reserve(elements.size());
  for (std::size_t i = 0; i < elements.size(); ++i) {
    if (elements[i].fType == TypeString) {
      out.push_back(*elements[i].fValue.tstring);
      continue;
    }
    std::printf("WARNING: ZUValue::ToStringArray: elem %d is not a string...\n",
                static_cast<int>(i));
    if (insertEmpty) {
      std::printf("...inserting an empty string.\n");
      out.emplace_back();
    }
    std::fflush(stdout);
  }
}

bool& ZUValue::boolRef() {
  if (fType == TypeInvalid) {
    xBecome(TypeBool);
  } else if (fType == TypeInt) {
    const bool b = fValue.tint != 0;
    fValue = Storage{};
    fValue.tbool = b;
    fType = TypeBool;
  }
  xAssertCompatibleType(TypeBool);
  return fValue.tbool;
}

float& ZUValue::floatRef() {
  if (fType == TypeInvalid) {
    xBecome(TypeFloat);
  } else if (fType == TypeInt) {
    const auto f = static_cast<float>(fValue.tint);
    fValue = Storage{};
    fValue.tfloat = f;
    fType = TypeFloat;
  }
  xAssertCompatibleType(TypeFloat);
  return fValue.tfloat;
}

TZUValueString& ZUValue::stringRef() {
  if (fType == TypeInvalid)
    xBecome(TypeString);
  xAssertCompatibleType(TypeString);
  xAssertStorage("stringRef");
  return *fValue.tstring;
}

TZUValueBinary& ZUValue::binaryRef() {
  if (fType == TypeInvalid)
    xBecome(TypeBinary);
  xAssertCompatibleType(TypeBinary);
  xAssertStorage("binaryRef");
  return *fValue.tbinary;
}

ZUValue& ZUValue::operator[](int i) {
  if (fType == TypeInvalid)
    xBecome(TypeArray);
  xAssertCompatibleType(TypeArray);
  xAssertIndex(i);
  return (*fValue.tarray)[static_cast<std::size_t>(i)];
}

void ZUValue::arraySetSize(int n) {
  if (fType == TypeInvalid)
    xBecome(TypeArray);
  xAssertCompatibleType(TypeArray);
  xAssertStorage("arraySetSize");
  if (n < 0)
    ZU_THROW_ERROR(kModule, "arraySetSize", "Invalid negative size: " + std::to_string(n));
  fValue.tarray->resize(static_cast<std::size_t>(n));
}

void ZUValue::arrayPush(const ZUValue& v) {
  ZUValue copy(v);
  if (fType == TypeInvalid)
    xBecome(TypeArray);
  xAssertCompatibleType(TypeArray);
  xAssertStorage("arrayPush");
  fValue.tarray->push_back(std::move(copy));
}

std::uintptr_t ZUValue::xStorageWord() const noexcept {
  switch (fType) {
    case TypeBool:
      return fValue.tbool ? 1u : 0u;
    case TypeInt:
      return static_cast<std::uint32_t>(fValue.tint);
    case TypeFloat:
      return std::bit_cast<std::uint32_t>(fValue.tfloat);
    case TypeArray:
      return reinterpret_cast<std::uintptr_t>(fValue.tarray);
    case TypeString:
      return reinterpret_cast<std::uintptr_t>(fValue.tstring);
    case TypeObject:
    case TypeBinary:
      return reinterpret_cast<std::uintptr_t>(fValue.tbinary);
    default:
      return 0;
  }
}

void ZUValue::xAssertStorage(const char* method) const {
  bool missing = false;
  switch (fType) {
    case TypeArray:
      missing = fValue.tarray == nullptr;
      break;
    case TypeString:
      missing = fValue.tstring == nullptr;
      break;
    case TypeObject:
    case TypeBinary:
      missing = fValue.tbinary == nullptr;
      break;
    default:
      break;
  }
  if (missing)
    ZU_THROW_ERROR(kModule, method, "Assert failed");
}

std::string ZUValue::xTypeErrorDescription(Type expected) const {
  return "Expected a " + TypeToString(expected) + " but received a " + TypeToString(fType) +
         " (zuvalue contents: " + toString(1) + " )";
}

void ZUValue::xAssertType(Type expected) const {
  if (fType != expected) {
    ZU_THROW_ERROR(kModule, "xAssertType: type error", xTypeErrorDescription(expected));
  }
}

void ZUValue::xAssertCompatibleType(Type expected) const {
  if (fType != expected) {
    ZU_THROW_ERROR(kModule, "xAssertCompatibleType: type error", xTypeErrorDescription(expected));
  }
}

void ZUValue::xAssertIndex(int index) const {
  if (index < 0) {
    ZU_THROW_ERROR(kModule, "xAssertArraySize", "Invalid negative index: " + std::to_string(index));
  }
  xAssertArraySize(static_cast<std::int64_t>(index) + 1);
}

void ZUValue::xAssertArraySize(std::int64_t requiredSize) const {
  if (fType != TypeArray) {
    ZU_THROW_ERROR(kModule, "xAssertArraySize",
                   "try to use a " + TypeToString(fType) + " like an array");
  }
  xAssertStorage("xAssertArraySize");
  const auto size = static_cast<std::int64_t>(fValue.tarray->size());
  if (size < requiredSize) {
    ZU_THROW_ERROR(kModule, "xAssertArraySize",
                   "The array has a size of " + std::to_string(size) +
                       " and you want it to be of size " + std::to_string(requiredSize));
  }
}

std::string ZUValue::toString(int verbosity) const {
  std::string out;
  if (verbosity <= 0)
    return out;
  out.reserve(1024);
  xDump(out, verbosity);
  return out;
}

void ZUValue::xDump(std::string& out, int verbosity) const {
  const bool tagged = verbosity >= 3;
  const bool detailed = verbosity >= 2;
  char buf[64];
  if (tagged)
    out += "\n<ZuValue>";
  if (detailed) {
    out += "ZuValue at 0x";
    out += pointerHex(reinterpret_cast<std::uintptr_t>(this));
    out += ", Type: ";
    out += TypeToString(fType);
    out += ", Value: 0x";
    out += pointerHex(xStorageWord());
    out += ", ";
  }
  switch (fType) {
    case TypeArray: {
      xAssertStorage("toString");
      const TZUValueArray& elements = *fValue.tarray;
      out += tagged ? "\n<Vector>" : "[";
      if (detailed) {
        out += "Vector of " + std::to_string(elements.size()) + " elem(s):";
      }
      for (std::size_t i = 0; i < elements.size(); ++i) {
        if (!tagged && i > 0)
          out += ", ";
        if (tagged)
          out += "\n<elem>\n";
        elements[i].xDump(out, verbosity);
        if (tagged)
          out += "\n</elem>";
      }
      out += tagged ? "\n</Vector>" : "]";
      break;
    }
    case TypeBool:
      if (detailed)
        out += "Bool:";
      out += fValue.tbool ? "true" : "false";
      break;
    case TypeInt:
      if (detailed) {
        std::snprintf(buf, sizeof buf, "Int: 0x%08X (", static_cast<unsigned>(fValue.tint));
        out += buf;
      }
      out += std::to_string(fValue.tint);
      if (detailed)
        out += ")";
      break;
    case TypeFloat:
      if (detailed)
        out += "Float: ";
      std::snprintf(buf, sizeof buf, "%.6g", static_cast<double>(fValue.tfloat));
      out += buf;
      break;
    case TypeString:
      xAssertStorage("toString");
      if (detailed)
        out += "String of size " + std::to_string(fValue.tstring->size()) + ": ";
      out += '"';
      out += *fValue.tstring;
      out += '"';
      break;
    case TypeObject:
      xAssertStorage("toString");
      out.append(fValue.tbinary->begin(), fValue.tbinary->end());
      break;
    case TypeBinary: {
      xAssertStorage("toString");
      const TZUValueBinary& bytes = *fValue.tbinary;
      if (tagged)
        out += "\n<Binary>Binary: " + std::to_string(bytes.size()) + " bytes(s):\n";
      for (unsigned char b : bytes) {
        out += '\\';
        out += std::to_string(static_cast<unsigned>(b));
      }
      if (tagged)
        out += "</Binary>\n";
      break;
    }
    default:
      break;
  }
  if (tagged && (fType == TypeInt || fType == TypeFloat || fType == TypeString))
    out += "\n";
  if (tagged)
    out += "\n</ZuValue>\n";
}

}  // namespace ZU
