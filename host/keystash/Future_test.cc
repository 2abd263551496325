#include "host/keystash/Future.h"

#include <gtest/gtest.h>

#include <string>
#include <thread>

namespace kestrova::mobile::xplat::keystash {
namespace {

int errorCodeOf(const std::function<void()>& action) {
  try {
    action();
  } catch (const FutureError& error) {
    return error.code();
  }
  return 0;
}

TEST(FutureTest, MisuseReportsTheDocumentedCodesAndTexts) {
  Future<int> invalid;
  EXPECT_EQ(errorCodeOf([&] { invalid.get(); }), 1);

  Promise<int> promise;
  Future<int> future = promise.getFuture();
  future.setCallback([](Future<int>) {});
  EXPECT_EQ(errorCodeOf([&] { future.get(); }), 2);
  EXPECT_EQ(errorCodeOf([&] { future.setCallback([](Future<int>) {}); }), 3);

  Future<std::string> orphan = Promise<std::string>().getFuture();
  EXPECT_EQ(errorCodeOf([&] { orphan.get(); }), 4);

  EXPECT_STREQ(FutureError(1).what(), "Shared state is invalid");
  EXPECT_STREQ(FutureError(2).what(), "Value may not be fetched if a callback is set");
  EXPECT_STREQ(FutureError(3).what(), "Callback may not be set again");
  EXPECT_STREQ(FutureError(4).what(), "Unknown error");
  EXPECT_STREQ(FutureError(0).what(), "Unknown error");
  const std::logic_error& asLogicError = FutureError(1);
  EXPECT_STREQ(asLogicError.what(), "Shared state is invalid");
}

TEST(FutureTest, GetIsSingleUseAndRethrowsTheProducersException) {
  Future<int> ready = makeReadyFuture<int>(7);
  EXPECT_EQ(ready.get(), 7);
  EXPECT_FALSE(ready.valid());
  EXPECT_EQ(errorCodeOf([&] { ready.get(); }), 1);

  Future<void> failed = makeFailedFuture<void>(std::make_exception_ptr(std::runtime_error("disk full")));
  EXPECT_THROW(
      {
        try {
          failed.get();
        } catch (const std::runtime_error& error) {
          EXPECT_STREQ(error.what(), "disk full");
          throw;
        }
      },
      std::runtime_error);
}

TEST(FutureTest, GetBlocksUntilAnotherThreadDelivers) {
  Promise<std::string> promise;
  Future<std::string> future = promise.getFuture();
  std::thread producer([&promise] { promise.setValue("late"); });
  EXPECT_EQ(future.get(), "late");
  producer.join();
}

TEST(FutureTest, CallbackGetsTheResultWhetherSetBeforeOrAfterIt) {
  std::string seen;
  Promise<std::string> early;
  Future<std::string> earlyFuture = early.getFuture();
  earlyFuture.setCallback([&seen](Future<std::string> ready) { seen += ready.get(); });
  EXPECT_EQ(seen, "");
  early.setValue("a");
  EXPECT_EQ(seen, "a");

  Future<std::string> late = makeReadyFuture<std::string>("b");
  late.setCallback([&seen](Future<std::string> ready) { seen += ready.get(); });
  EXPECT_EQ(seen, "ab");

  Future<std::string> dropped;
  {
    Promise<std::string> promise;
    dropped = promise.getFuture();
    dropped.setCallback([&seen](Future<std::string> ready) {
      try {
        ready.get();
      } catch (const FutureError& error) {
        seen += std::to_string(error.code());
      }
    });
  }
  EXPECT_EQ(seen, "ab4");
}

// A failure made by another copy of the C++ runtime (an exception of a
// library other than the consumer's) comes out as the consumer's own
// exception of the same kind and text; within one runtime it is the very
// exception the producer set.
TEST(FutureTest, FailuresFromAnotherRuntimeAreRebuiltByKindAndText) {
  struct Custom : std::runtime_error {
    Custom() : std::runtime_error("custom failure") {}
  };
  const int elsewhere = 0;
  auto foreign = [&](std::exception_ptr error) {
    detail::Failure failure = detail::Failure::of(std::move(error));
    failure.runtime = &elsewhere;
    return failure;
  };

  EXPECT_THROW(foreign(std::make_exception_ptr(Custom())).rethrow(), std::runtime_error);
  try {
    foreign(std::make_exception_ptr(Custom())).rethrow();
  } catch (const Custom&) {
    ADD_FAILURE() << "the producer's own type crossed runtimes";
  } catch (const std::runtime_error& error) {
    EXPECT_STREQ(error.what(), "custom failure");
  }
  EXPECT_EQ(errorCodeOf([&] { foreign(std::make_exception_ptr(FutureError(3))).rethrow(); }), 3);
  EXPECT_THROW(foreign(std::make_exception_ptr(std::bad_alloc())).rethrow(), std::bad_alloc);
  EXPECT_THROW(foreign(std::make_exception_ptr(42)).rethrow(), int);

  Future<int> local = makeFailedFuture<int>(std::make_exception_ptr(Custom()));
  EXPECT_THROW(local.get(), Custom);
}

}  // namespace
}  // namespace kestrova::mobile::xplat::keystash
