#include "tests/movies/PatientMovies.h"

#include <thread>

namespace qv::platform::test {
namespace {

class PatientInput final : public WriterInput {
 public:
  explicit PatientInput(std::shared_ptr<WriterInput> inner) : inner_(std::move(inner)) {}
  void setTransform(const AffineTransform& transform) override { inner_->setTransform(transform); }
  void setExpectsMediaDataInRealTime(bool) override {}
  [[nodiscard]] bool isReadyForMoreMediaData() const override {
    while (writer_ && writer_->status() == AssetWriterStatus::Writing && !inner_->isReadyForMoreMediaData()) {
      std::this_thread::yield();
    }
    return inner_->isReadyForMoreMediaData();
  }
  bool append(const SampleBufferRef& sample) override { return inner_->append(sample); }

  const std::shared_ptr<WriterInput>& join(const AssetWriter& writer) {
    writer_ = &writer;
    return inner_;
  }

 private:
  const std::shared_ptr<WriterInput> inner_;
  const AssetWriter* writer_ = nullptr;
};

class PatientWriter final : public AssetWriter {
 public:
  PatientWriter(std::unique_ptr<AssetWriter> inner, URL outputURL, std::shared_ptr<kit::Events<bool>> finished)
      : inner_(std::move(inner)), outputURL_(std::move(outputURL)), finished_(std::move(finished)) {}
  ~PatientWriter() override { finished_->add(true); }
  [[nodiscard]] AssetWriterStatus status() const override { return inner_->status(); }
  [[nodiscard]] std::optional<Error> error() const override { return inner_->error(); }
  [[nodiscard]] const URL& outputURL() const override { return outputURL_; }
  [[nodiscard]] std::shared_ptr<const AssetWriterCounts> counts() const override { return inner_->counts(); }
  void addInput(std::shared_ptr<WriterInput> input) override {
    inner_->addInput(static_cast<PatientInput&>(*input).join(*inner_));
  }
  bool startWriting() override { return inner_->startWriting(); }
  void startSessionAtSourceTime(MediaTime time) override { inner_->startSessionAtSourceTime(time); }
  void endSessionAtSourceTime(MediaTime time) override { inner_->endSessionAtSourceTime(time); }
  void finishWriting(std::function<void()> completion) override {
    inner_->finishWriting([completion = std::move(completion), finished = finished_] {
      completion();
      finished->add(true);
    });
  }

 private:
  const std::unique_ptr<AssetWriter> inner_;
  const URL outputURL_;
  const std::shared_ptr<kit::Events<bool>> finished_;
};

}  // namespace

Result<std::unique_ptr<AssetWriter>> PatientMovies::createAssetWriter(const URL& outputURL,
                                                                      const std::string& fileType) {
  auto made = service_.createAssetWriter(URL::fileURL(path_), fileType);
  if (!made) return made.error();
  return std::unique_ptr<AssetWriter>(std::make_unique<PatientWriter>(std::move(*made), outputURL, finished_));
}

std::shared_ptr<WriterInput> PatientMovies::createWriterInput(MediaType type, const Dictionary& outputSettings) {
  return std::make_shared<PatientInput>(service_.createWriterInput(type, outputSettings));
}

}  // namespace qv::platform::test
