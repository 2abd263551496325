#include "host/keystash/SqliteKeyValueStore.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "host/keystash/testing/TemporaryDirectory.h"

namespace kestrova::mobile::xplat::keystash {
namespace {

using FileUtils::BinaryData;

std::optional<std::string> read(PersistentKeyValueStore& store, const std::string& key) {
  auto entry = store.fetch(key, std::nullopt).get();
  if (!entry) return std::nullopt;
  return entry->data.toString();
}

void write(PersistentKeyValueStore& store, const std::string& key, const std::string& value) {
  store.store(key, BinaryData(value), BinaryData()).get();
}

TEST(SqliteKeyValueStore, StoresBytesExactlyAndLastWriteWins) {
  TemporaryDirectory dir;
  SqliteKeyValueStore store(dir.file("kv.db"));
  EXPECT_EQ(read(store, "absent"), std::nullopt);

  const std::string binary("line\n\0\xff\xc3\xa9 end", 12);
  write(store, "k", binary);
  EXPECT_EQ(read(store, "k"), binary);
  write(store, "k", "");
  EXPECT_EQ(read(store, "k"), std::string());  // stored empty, not absent
  write(store, "k", "second");
  EXPECT_EQ(read(store, "k"), "second");

  store.store("with-extra", BinaryData(std::string("v")), BinaryData(std::string("x"))).get();
  auto entry = store.fetch("with-extra", std::nullopt).get();
  ASSERT_TRUE(entry);
  EXPECT_EQ(entry->extra, "x");
  EXPECT_EQ(read(store, std::string("k\0", 2)), std::nullopt);  // keys are byte strings too
}

TEST(SqliteKeyValueStore, ValuesSurviveNewObjectsAndAKilledProcess) {
  TemporaryDirectory dir;
  const std::string path = dir.file("kv.db");
  {
    SqliteKeyValueStore store(path);
    write(store, "before", "1");
  }
  SqliteKeyValueStore parentStore(path);
  EXPECT_EQ(read(parentStore, "before"), "1");  // now kept in memory
  pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    // The write has completed when get() returns; die without any clean-up.
    SqliteKeyValueStore store(path);
    write(store, "from-child", "written then killed");
    write(store, "before", "2");
    raise(SIGKILL);
    _exit(1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFSIGNALED(status));

  EXPECT_EQ(read(parentStore, "before"), "2");  // a live store sees the other process's write
  SqliteKeyValueStore reopened(path);
  EXPECT_EQ(read(reopened, "before"), "2");
  EXPECT_EQ(read(reopened, "from-child"), "written then killed");
}

TEST(SqliteKeyValueStore, StoresOverOneFileSeeEachOthersWrites) {
  TemporaryDirectory dir;
  SqliteKeyValueStore first(dir.file("kv.db"));
  SqliteKeyValueStore second(dir.file("kv.db"));
  EXPECT_EQ(read(second, "k"), std::nullopt);
  write(first, "k", "1");
  EXPECT_EQ(read(second, "k"), "1");
  EXPECT_EQ(read(first, "k"), "1");
  write(second, "k", "2");
  EXPECT_EQ(read(first, "k"), "2");
  write(first, "big", std::string(200000, 'm'));  // too big to keep in memory, read each time
  EXPECT_EQ(read(second, "big"), std::string(200000, 'm'));
  write(second, "big", "small");
  EXPECT_EQ(read(first, "big"), "small");
}

// Reads from one store race with writes through another: once a write has
// returned, no read may still give an older value, whatever the reader had
// put in memory while the write was in progress.
TEST(SqliteKeyValueStore, NoReadAfterAWriteReturnsAnOlderValue) {
  TemporaryDirectory dir;
  SqliteKeyValueStore writer(dir.file("kv.db"));
  SqliteKeyValueStore reader(dir.file("kv.db"));
  write(writer, "k", "0");
  constexpr int kWrites = 200;
  std::atomic<int> written{0};
  std::atomic<int> stale{0};
  std::thread readerThread([&] {
    while (written < kWrites) {
      const int before = written;
      const int value = std::stoi(read(reader, "k").value_or("-1"));
      if (value < before) ++stale;
    }
  });
  for (int i = 1; i <= kWrites; ++i) {
    write(writer, "k", std::to_string(i));
    written = i;
  }
  readerThread.join();
  EXPECT_EQ(stale, 0);
  EXPECT_EQ(read(reader, "k"), std::to_string(kWrites));
}

TEST(SqliteKeyValueStore, ConcurrentWritersNeverTearAValue) {
  TemporaryDirectory dir;
  SqliteKeyValueStore first(dir.file("kv.db"));
  SqliteKeyValueStore second(dir.file("kv.db"));  // another connection to the same file
  std::atomic<bool> torn{false};
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      PersistentKeyValueStore& store = t % 2 ? first : second;
      for (int i = 0; i < 50; ++i) {
        // Each value is one repeated letter whose count encodes it.
        write(store, "shared", std::string(1000 + 100 * t + i, static_cast<char>('a' + t)));
        auto value = read(store, "shared");
        if (!value || value->size() < 1000 ||
            value->find_first_not_of(value->front()) != std::string::npos ||
            (value->size() - 1000) / 100 != static_cast<size_t>(value->front() - 'a')) {
          torn = true;
        }
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_FALSE(torn);
}

TEST(SqliteKeyValueStore, UnopenableDatabaseThrowsWithThePath) {
  TemporaryDirectory dir;
  try {
    SqliteKeyValueStore store(dir.file("missing/dir/kv.db"));
    FAIL() << "expected an exception";
  } catch (const std::runtime_error& error) {
    EXPECT_NE(std::string(error.what()).find("missing/dir/kv.db"), std::string::npos) << error.what();
  }
}

}  // namespace
}  // namespace kestrova::mobile::xplat::keystash
