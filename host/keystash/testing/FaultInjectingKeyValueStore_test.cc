#include "host/keystash/testing/FaultInjectingKeyValueStore.h"

#include <gtest/gtest.h>

#include <memory>
#include <stdexcept>
#include <string>

#include "host/keystash/InMemoryKeyValueStore.h"

namespace kestrova::mobile::xplat::keystash {
namespace {

using Failure = FaultInjectingKeyValueStore::Failure;

std::optional<std::string> get(PersistentKeyValueStore& store, const std::string& key) {
  auto entry = store.fetch(key, std::nullopt).get();
  return entry ? std::optional<std::string>(entry->data.toString()) : std::nullopt;
}

bool put(PersistentKeyValueStore& store, const std::string& key, const std::string& value) {
  try {
    store.store(key, FileUtils::BinaryData(value), FileUtils::BinaryData()).get();
    return true;
  } catch (const std::runtime_error&) {
    return false;
  }
}

TEST(FaultInjectingKeyValueStore, FailsTheNthCallOnlyOrFromThenOn) {
  auto memory = std::make_shared<InMemoryKeyValueStore>();
  FaultInjectingKeyValueStore store(memory);
  store.failStores(Failure::kInGet, nullptr, 2, /*once=*/true);
  EXPECT_TRUE(put(store, "k", "1"));
  EXPECT_FALSE(put(store, "k", "2"));  // the second call fails in get() and changes nothing
  EXPECT_EQ(memory->peek("k"), "1");
  EXPECT_TRUE(put(store, "k", "3"));
  EXPECT_EQ(get(store, "k"), "3");

  store.failFetches(Failure::kInCall, std::make_exception_ptr(std::logic_error("gone")), 2);
  EXPECT_EQ(get(store, "k"), "3");
  for (int i = 0; i < 3; ++i) EXPECT_THROW(store.fetch("k", std::nullopt), std::logic_error);
  store.failFetches(Failure::kNone);
  EXPECT_EQ(get(store, "k"), "3");
  EXPECT_EQ(store.fetchCount(), 6u);
  EXPECT_EQ(store.storeCount(), 3u);
}

}  // namespace
}  // namespace kestrova::mobile::xplat::keystash
