#include <cstring>
#include <unordered_set>

#include "platform/foundation/Hash.h"
#include "platform/foundation/PropertyListDocument.h"
#include "platform/foundation/Value.h"
#include "platform/foundation/ValueStorage.h"

namespace kx {
namespace {

struct Pair {
  Value a;
  Value b;
};

// What makes two containers the very same: storage, and for documents the object.
struct Identity {
  const ValueStorage* owner;
  std::uint64_t object;
  bool operator==(const Identity&) const = default;
};

Identity identityOf(const Value& value) {
  return {ValueAccess::owner(value), ValueAccess::inDocument(value) ? ValueAccess::bits(value) : 0};
}

struct IdentityPair {
  Identity a;
  Identity b;
  bool operator==(const IdentityPair&) const = default;
};

struct IdentityPairHash {
  std::size_t operator()(const IdentityPair& pair) const {
    const HashSeed& seed = processHashSeed();
    const auto one = [&seed](const Identity& identity) {
      return hashNumber(reinterpret_cast<std::uintptr_t>(identity.owner), identity.object, seed);
    };
    return hashNumber(one(pair.a), one(pair.b), seed);
  }
};

bool scalarsEqual(const Value& a, const Value& b) {
  switch (a.kind()) {
    case Kind::kNull:
      return true;
    case Kind::kNumber:
      return a.numberValue() == b.numberValue();
    case Kind::kDate:
      return a.dateValue() == b.dateValue();
    case Kind::kUid:
      return a.uidValue() == b.uidValue();
    default:
      return ValueAccess::text(a) == ValueAccess::text(b);
  }
}

bool isContainer(const Value& value) { return value.isArray() || value.isDictionary(); }

// Compares with a stack of its own, so that depth costs no call stack. A pair of containers that
// has been met needs no second comparison: that keeps graphs of shared containers cheap. Pairs are
// remembered only once the comparison has grown long.
class Comparison {
 public:
  bool run(const Value& a, const Value& b) {
    if (!meet(a, b)) return false;
    while (!stack_.empty()) {
      const Pair pair = std::move(stack_.back());
      stack_.pop_back();
      if (!(pair.a.isArray() ? arraysMeet(pair) : dictionariesMeet(pair))) return false;
    }
    return true;
  }

 private:
  static constexpr std::size_t kRememberAfter = 4096;

  bool meet(const Value& a, const Value& b) {
    if (a.kind() != b.kind()) return false;
    if (!isContainer(a)) return scalarsEqual(a, b);
    if (ValueAccess::size(a) != ValueAccess::size(b)) return false;
    const IdentityPair identities{identityOf(a), identityOf(b)};
    if (identities.a == identities.b) return true;
    if (++met_ > kRememberAfter && !seen_.insert(identities).second) return true;
    stack_.push_back(Pair{a, b});
    return true;
  }
  bool arraysMeet(const Pair& pair) {
    const ArrayView a = pair.a.arrayValue();
    const ArrayView b = pair.b.arrayValue();
    for (std::size_t i = 0, count = a.size(); i < count; ++i) {
      if (!meet(a[i], b[i])) return false;
    }
    return true;
  }
  bool dictionariesMeet(const Pair& pair) {
    const DictionaryView a = pair.a.dictionaryValue();
    for (std::size_t i = 0, count = a.size(); i < count; ++i) {
      const Value other = pair.b[a.keyAt(i)];
      if (other.isNull() || !meet(a.valueAt(i), other)) return false;
    }
    return true;
  }

  std::vector<Pair> stack_;
  std::unordered_set<IdentityPair, IdentityPairHash> seen_;
  std::size_t met_ = 0;
};

}  // namespace

bool operator==(const Value& a, const Value& b) {
  if (a.kind() != b.kind()) return false;
  if (!isContainer(a)) return scalarsEqual(a, b);
  return Comparison().run(a, b);
}

}  // namespace kx
