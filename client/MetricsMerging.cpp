#include "client/MetricsMerging.h"

#include <utility>

namespace telvane {
namespace {

Value merged(const Value& present, const Value& added) {
  if (present.isDictionary() && added.isDictionary()) {
    Dictionary dictionary = *present.dictionary();
    dictionary.addEntriesFrom(*added.dictionary());
    return dictionary;
  }
  if (present.isArray() && added.isArray()) {
    Array array = *present.array();
    array.reserve(array.size() + added.array()->size());
    for (const Value& element : *added.array()) array.append(element);
    return array;
  }
  return added;
}

}  // namespace

void mergeMetrics(Dictionary& payload, const Dictionary& metrics) {
  for (const DictionaryEntry& entry : metrics) payload.set(entry.key, merged(payload[entry.key.view()], entry.value));
}

}  // namespace telvane
