// What makes it safe to leave a record out:
// 1. Only rules that say equality count: a string without operator or with "=", or alternatives of such. Everything
//    else (other operators, booleans, dictionaries, the user's election, which is no property of a record) narrows
//    nothing.
// 2. Values are looked up where the rules look: the keys with a meaning of their own, then attributes, then Info.plist.
// 3. Equality is that of the numeric order, which is what leaving out leading zeros keeps.
#include "platform/registry/QueryIndex.h"

#include <algorithm>
#include <iterator>
#include <span>
#include <string_view>

#include "platform/value/NumericOrder.h"

namespace platform {
namespace {

constexpr std::string_view kEntitlementPrefix = "ENTITLEMENT:";
// So many rules of one query are used, so that a query cannot order any number of indexes to be made.
constexpr std::size_t kMostRules = 8;
// So few candidates are tested sooner than narrowed further.
constexpr std::size_t kFewEnough = 8;

// What an operator expression wants a value to be equal to; nothing when it is no equality.
std::optional<std::string_view> equalityOperand(const std::string& pattern) {
  if (pattern.empty()) return pattern;
  if (pattern.front() == '=') return std::string_view(pattern).substr(1);
  const bool isOperator = pattern.front() == '?' || pattern.front() == '<' || pattern.front() == '>';
  return isOperator ? std::nullopt : std::optional<std::string_view>(pattern);
}

// The operands of a pattern that says nothing but equality. An array's other kinds match nothing, so they do not count.
std::optional<std::vector<std::string>> equalityOperands(const Value& pattern) {
  std::vector<std::string> operands;
  if (!pattern.isString() && !pattern.isArray()) return std::nullopt;
  for (const Value& each : pattern.isString() ? std::span<const Value>(&pattern, 1) : pattern.items()) {
    if (!each.isString()) continue;
    const auto operand = equalityOperand(each.string());
    if (!operand) return std::nullopt;
    operands.push_back(withoutLeadingZeros(*operand));
  }
  return operands;
}

// The value that a rule's key selects, when its kind is a string or an array; nothing when there is none.
Value valueFor(const ARExtoraProxy& record, const std::string& key) {
  if (key.starts_with(kEntitlementPrefix)) {
    return record.entitlements[std::string_view(key).substr(kEntitlementPrefix.size())];
  }
  if (key == "HXExtensionContainingApp") {
    const auto* application = record.containingApplication;
    return application != nullptr && application->bundleURL ? Value(application->bundleURL->path()) : Value();
  }
  if (key == "HXExtensionIdentifier" && !record.plugInIdentifier.empty()) return record.plugInIdentifier;
  if (key == "com.orvane.uuid" && record.plugInUUID) return record.plugInUUID->text();
  const Value& attribute = record.infoDictionary["HXExtension"]["HXExtensionAttributes"][key];
  return attribute.isNothing() ? record.infoDictionary[key] : attribute;
}

}  // namespace

QueryIndex::Postings QueryIndex::makePostings(const std::string& key) const {
  Postings postings;
  for (std::uint32_t position = 0; position < records_.size(); ++position) {
    const Value value = valueFor(*records_[position], key);
    for (const Value& each : value.isArray() ? value.items() : std::span<const Value>(&value, 1)) {
      if (!each.isString()) continue;
      Positions& positions = postings[withoutLeadingZeros(each.string())];
      if (positions.empty() || positions.back() != position) positions.push_back(position);
    }
  }
  return postings;
}

std::shared_ptr<const QueryIndex::Postings> QueryIndex::postingsFor(const std::string& key) const {
  MutexLock lock(mutex_);
  if (const auto found = keys_.find(key); found != keys_.end()) {
    ++found->second.uses;
    return found->second.postings;
  }
  if (keys_.size() >= kQueryIndexKeys) {
    keys_.erase(std::min_element(keys_.begin(), keys_.end(),
                                 [](const auto& a, const auto& b) { return a.second.uses < b.second.uses; }));
  }
  auto postings = std::make_shared<const Postings>(makePostings(key));
  keys_.emplace(key, Key{postings, 1});
  return postings;
}

std::optional<std::vector<std::uint32_t>> QueryIndex::candidates(const Value& query) const {
  std::optional<Positions> result;
  std::size_t rulesUsed = 0;
  for (const Value::Entry& rule : query.entries()) {
    if (rulesUsed == kMostRules || (result && result->size() <= kFewEnough)) break;
    if (rule.key == "HXUserElection") continue;
    const auto operands = equalityOperands(rule.value);
    if (!operands) continue;
    ++rulesUsed;
    const auto postings = postingsFor(rule.key);
    Positions positions;
    for (const std::string& operand : *operands) {
      const auto found = postings->find(operand);
      if (found == postings->end()) continue;
      positions.insert(positions.end(), found->second.begin(), found->second.end());
    }
    if (operands->size() > 1) {
      std::sort(positions.begin(), positions.end());
      positions.erase(std::unique(positions.begin(), positions.end()), positions.end());
    }
    if (result) {
      Positions both;
      std::set_intersection(result->begin(), result->end(), positions.begin(), positions.end(),
                            std::back_inserter(both));
      positions = std::move(both);
    }
    result = std::move(positions);
  }
  return result;
}

std::size_t QueryIndex::keyCount() const {
  MutexLock lock(mutex_);
  return keys_.size();
}

bool QueryIndex::hasKey(const std::string& key) const {
  MutexLock lock(mutex_);
  return keys_.contains(key);
}

}  // namespace platform
