#include <cstring>
#include <future>

#include "platform/base/RawRecord.h"
#include "platform/base/SampleBuffer.h"
#include "protocol/QVSharedFrameObject.h"
#include "sdk/c/quorvel/quorvel.h"
#include "tests/sdk/DaemonSocket.h"

namespace qv::client {
namespace {

using platform::Dictionary;
using platform::Value;

/// What the C program was told, and what it kept of it.
struct Program {
  std::vector<int64_t> codes;  // of errors, 0 for none
  const quorvel_error* error = nullptr;
  const quorvel_video_frame* frame = nullptr;
  const quorvel_value* info = nullptr;

  static void told(void* context, const quorvel_error* error) {
    auto& program = *static_cast<Program*>(context);
    program.codes.push_back(error ? error->code : 0);
    if (error) program.error = quorvel_error_retain(error);
  }
  static void started(void* context, const quorvel_error* error, bool, bool) { told(context, error); }
  static void pictured(void* context, const quorvel_video_frame* frame) {
    static_cast<Program*>(context)->frame = quorvel_video_frame_retain(frame);
  }
  static void informed(void* context, const quorvel_value* info) {
    static_cast<Program*>(context)->info = quorvel_value_retain(info);
  }
};

class CInterface : public DaemonSocket {
 protected:
  CInterface() {
    quorvel_recorder_options options = QUORVEL_RECORDER_OPTIONS_INIT;
    options.queue = events_;
    options.events.context = &program_;
    options.events.video_frame = Program::pictured;
    options.events.broadcast_service_info_changed = Program::informed;
    recorder_ = quorvel_recorder_create(&options);
  }
  ~CInterface() override {
    quorvel_recorder_destroy(recorder_);
    quorvel_queue_release(events_);
  }
  void runUntil(const std::function<bool()>& isDone) {
    while (!isDone()) ASSERT_GT(quorvel_queue_wait(events_, 60'000), 0u) << "nothing came";
  }
  /// Connects, by a request that the daemon answers.
  void connect() {
    quorvel_recorder_discard(recorder_, Program::told, &program_);
    daemon_.object->takeCall().reply({});
    daemonEnd_ = daemon_.connections.next();
    runUntil([&] { return program_.codes == std::vector<int64_t>{0}; });
  }

  Program program_;
  quorvel_queue* const events_ = quorvel_queue_create();
  quorvel_recorder* recorder_ = nullptr;
};

TEST_F(CInterface, WhatIsRetainedOutlivesTheHandlerAndTheRecorder) {
  connect();
  auto frame = *platform::SharedFrame::create({2, 2, 8, platform::PixelFormat::BGRX});
  std::memset(frame->mutableBytes().data(), 0x5a, 16);
  std::promise<void> returned;
  std::shared_ptr<void> hold(nullptr, [&, frame](void*) { returned.set_value(); });
  const platform::SampleTimingInfo timing{{}, platform::MediaTime::make(5, 1), {}};
  daemonEnd_->call("captureHandlerWithSample",
                   {QVSharedFrameObject({std::move(hold), frame.get()}).encodeForIPC(), platform::rawBytes(timing)}, {},
                   {});
  runUntil([&] { return program_.frame != nullptr; });
  quorvel_recorder_destroy(std::exchange(recorder_, nullptr));
  EXPECT_EQ(program_.frame->pixels[15], 0x5a);
  EXPECT_EQ(program_.frame->stride, 8u);
  EXPECT_EQ(program_.frame->presentation_time, 5'000'000'000);
  EXPECT_EQ(program_.frame->duration, QUORVEL_NO_DURATION);
  quorvel_video_frame_release(program_.frame);
  EXPECT_EQ(returned.get_future().wait_for(kit::kNever), std::future_status::ready);
}

TEST_F(CInterface, AnErrorCanBeKeptAndNothingRunsAfterTheRecorder) {
  stopDaemon();
  const quorvel_start_options options = QUORVEL_START_OPTIONS_INIT;
  quorvel_recorder_start(recorder_, &options, Program::started, &program_);
  runUntil([&] { return !program_.codes.empty(); });
  ASSERT_NE(program_.error, nullptr);
  EXPECT_EQ(program_.error->code, QUORVEL_ERROR_CONNECTION_INVALID);
  EXPECT_STREQ(program_.error->key, "RECORDING_ERROR_CONNECTION_INVALID");
  EXPECT_STREQ(program_.error->domain, QUORVEL_ERROR_DOMAIN);
  EXPECT_STRNE(program_.error->text, "");
  quorvel_error_release(program_.error);

  quorvel_recorder_discard(recorder_, Program::told, &program_);
  quorvel_recorder_destroy(std::exchange(recorder_, nullptr));
  quorvel_queue_run(events_);
  EXPECT_EQ(program_.codes.size(), 1u);
}

TEST_F(CInterface, ValuesGoToTheDaemonAndComeBack) {
  quorvel_value* info = quorvel_value_create_dictionary();
  quorvel_value* list = quorvel_value_create_list();
  EXPECT_TRUE(quorvel_list_append(list, quorvel_value_create_real(0.5)));
  EXPECT_TRUE(quorvel_list_append(list, quorvel_value_create_bytes("\0\1", 2)));
  EXPECT_TRUE(quorvel_dictionary_set(info, "text", quorvel_value_create_text("täxt")));
  EXPECT_TRUE(quorvel_dictionary_set(info, "list", list));
  quorvel_value_retain(info);
  EXPECT_FALSE(quorvel_list_append(list, info)) << "a value that holds itself would never end";
  EXPECT_FALSE(quorvel_list_append(info, quorvel_value_create_bool(true)));

  quorvel_broadcast_options options = QUORVEL_BROADCAST_OPTIONS_INIT;
  options.user_info = info;
  options.size = offsetof(quorvel_broadcast_options, user_info);  // an older program's: it has no such entry
  quorvel_recorder_setup_broadcast(recorder_, &options, nullptr, nullptr);
  EXPECT_TRUE(daemon_.object->takeCall().arguments[3].asDictionary().empty());
  options.size = sizeof options;
  quorvel_recorder_setup_broadcast(recorder_, &options, nullptr, nullptr);
  quorvel_value_release(info);
  const auto call = daemon_.object->takeCall();
  daemonEnd_ = daemon_.connections.next();
  daemonEnd_->call("updateBroadcastServiceInfo", {call.arguments[3]}, {}, {});
  runUntil([&] { return program_.info != nullptr; });

  EXPECT_STREQ(quorvel_value_get_text(quorvel_dictionary_get(program_.info, "text")), "täxt");
  EXPECT_STREQ(quorvel_dictionary_get_key(program_.info, 0), "list");
  const quorvel_value* back = quorvel_value_get_entry(program_.info, 0);
  EXPECT_EQ(quorvel_value_get_real(quorvel_value_get_entry(back, 0)), 0.5);
  size_t size = 0;
  EXPECT_EQ(std::memcmp(quorvel_value_get_bytes(quorvel_value_get_entry(back, 1), &size), "\0\1", 2), 0);
  EXPECT_EQ(size, 2u);
  EXPECT_EQ(quorvel_value_get_entry(back, 2), nullptr);
  quorvel_value_release(program_.info);
}

}  // namespace
}  // namespace qv::client
