#include <framework/mlt.h>
#include <gmock/gmock.h>

#include <filesystem>
#include <future>
#include <string>

#include "tests/library/library_clip.h"

// The MLT filter in a program that plays: controls change while frames are drawn.
namespace calmframe {
namespace {

namespace fs = std::filesystem;

class MltPlayTest : public testing::Test {
 protected:
  static void SetUpTestSuite() {
    static const ScratchFolder modules;
    for (const char* name : {"libmltcore.so", "libmltavformat.so"}) {
      fs::create_symlink(fs::path(MLT_MODULES) / name, modules.In(name));
    }
    fs::create_symlink(CALMFRAME_MODULE, modules.In("libmltcalmframe.so"));
    ASSERT_TRUE(mlt_factory_init(modules.In("").c_str()));
  }

  MltPlayTest() {
    profile->width = Street::kWidth;
    profile->height = Street::kHeight;
    profile->frame_rate_num = 25;
    profile->frame_rate_den = 1;
    profile->sample_aspect_num = profile->sample_aspect_den = 1;
    profile->display_aspect_num = 4;
    profile->display_aspect_den = 3;
    profile->progressive = 1;
    clip = mlt_factory_producer(profile, "avformat", street.path.c_str());
  }
  ~MltPlayTest() override {
    Detach();
    mlt_producer_close(clip);
    mlt_profile_close(profile);
  }

  mlt_properties Attach() {
    filter = mlt_factory_filter(profile, "calmframe", nullptr);
    mlt_properties_set(MLT_FILTER_PROPERTIES(filter), "filename", results.c_str());
    mlt_producer_attach(clip, filter);
    return MLT_FILTER_PROPERTIES(filter);
  }
  void Detach() {
    if (!filter) return;
    mlt_producer_detach(clip, filter);
    mlt_filter_close(filter);
    filter = nullptr;
  }
  std::string Draw(int number) {
    mlt_producer_seek(clip, number);
    mlt_frame frame = nullptr;
    EXPECT_EQ(mlt_service_get_frame(MLT_PRODUCER_SERVICE(clip), &frame, 0), 0);
    std::uint8_t* pixels = nullptr;
    mlt_image_format format = mlt_image_rgba;
    int width = Street::kWidth, height = Street::kHeight;
    EXPECT_EQ(mlt_frame_get_image(frame, &pixels, &format, &width, &height, 0), 0);
    EXPECT_EQ(format, mlt_image_rgba);
    EXPECT_EQ(width, Street::kWidth);
    const std::string drawn(reinterpret_cast<const char*>(pixels),
                            std::size_t{Street::kWidth} * Street::kHeight * 4);
    mlt_frame_close(frame);
    return drawn;
  }
  void Analyse() {
    mlt_properties_set_int(Attach(), "analyze", 1);
    for (int f = 0; f < Street::kFrames; ++f) Draw(f);
    ASSERT_STREQ(mlt_properties_get(MLT_FILTER_PROPERTIES(filter), "results"), results.c_str())
        << mlt_properties_get(MLT_FILTER_PROPERTIES(filter), "error");
  }

  const Street street;
  const std::string results = street.folder.In("street.calm");
  const mlt_profile profile = mlt_profile_init("square_pal");
  mlt_producer clip = nullptr;
  mlt_filter filter = nullptr;
};

TEST_F(MltPlayTest, AControlActsWhenItIsSolvedAndUntilThenTheOldOneDoes) {
  const std::string filmed = Draw(8);
  Analyse();
  const std::string before = Draw(8);
  EXPECT_NE(before, filmed);
  struct Listener {
    std::promise<void> solved;
    bool is_told = false;
    static void Changed(mlt_properties, Listener* self, mlt_event_data data) {
      const char* const name = mlt_event_data_to_string(data);
      if (name && std::string(name) == "results" && !std::exchange(self->is_told, true)) {
        self->solved.set_value();
      }
    }
  } listener;
  const mlt_properties properties = MLT_FILTER_PROPERTIES(filter);
  mlt_properties_set_double(properties, "smoothness", 10);
  mlt_properties_set(properties, "method", "position");
  mlt_events_listen(properties, &listener, "property-changed",
                    reinterpret_cast<mlt_listener>(Listener::Changed));
  EXPECT_EQ(Draw(8), before);
  listener.solved.get_future().wait();
  const std::string after = Draw(8);
  EXPECT_NE(after, before);
  mlt_events_disconnect(properties, &listener);
  Detach();
  // As one that has it from the first frame on.
  const mlt_properties fresh = Attach();
  mlt_properties_set(fresh, "results", results.c_str());
  mlt_properties_set_double(fresh, "smoothness", 10);
  mlt_properties_set(fresh, "method", "position");
  EXPECT_EQ(Draw(8), after);
  // Closed while another is being solved.
  mlt_properties_set_double(fresh, "smoothness", 30);
  EXPECT_EQ(Draw(8), after);
  Detach();
  EXPECT_EQ(Draw(8), filmed);
}

TEST_F(MltPlayTest, AnAnalysisThatIsClosedOrLeftLeavesNothing) {
  const mlt_properties properties = Attach();
  mlt_properties_set_int(properties, "analyze", 1);
  for (int f = 0; f < 10; ++f) Draw(f);
  // Played from its start once more, it begins anew; left, it ends.
  for (int f = 0; f < 5; ++f) Draw(f);
  mlt_properties_set_int(properties, "analyze", 0);
  Draw(5);
  for (int f = 6; f < Street::kFrames; ++f) Draw(f);
  EXPECT_FALSE(fs::exists(results));
  mlt_properties_set_int(properties, "analyze", 1);
  for (int f = 0; f < 10; ++f) Draw(f);
  Detach();
  EXPECT_FALSE(fs::exists(results));
  Analyse();
  EXPECT_TRUE(fs::exists(results));
}

// A smaller file in the place of the one that was analysed, as editors have it.
TEST_F(MltPlayTest, AStandInIsTakenForItsOriginalAndAnotherSpeedIsNot) {
  Analyse();
  Detach();
  const std::string proxy = street.folder.In("proxy.mkv");
  fs::copy_file(street.path, proxy);
  mlt_producer_close(clip);
  fs::resize_file(proxy, fs::file_size(proxy) - 1);  // other bytes, the same frames
  clip = mlt_factory_producer(profile, "avformat", proxy.c_str());
  const auto error = [this] {
    mlt_properties_set(Attach(), "results", results.c_str());
    Draw(8);
    const char* const line = mlt_properties_get(MLT_FILTER_PROPERTIES(filter), "error");
    const std::string text = line ? line : "";
    Detach();
    return text;
  };
  EXPECT_THAT(error(), testing::HasSubstr("another clip"));
  const mlt_properties properties = MLT_PRODUCER_PROPERTIES(clip);
  mlt_properties_set(properties, "kdenlive:originalurl", street.path.c_str());
  EXPECT_EQ(error(), "");
  mlt_properties_set_double(properties, "warp_speed", 2);
  EXPECT_THAT(error(), testing::HasSubstr("another clip"));
}

}  // namespace
}  // namespace calmframe
