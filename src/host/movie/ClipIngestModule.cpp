#include "ClipIngestModule.h"

#include "ClipIngest.h"

namespace {

class Module final : public ClipIngestModule {
public:
    ClipIngestReport ingest(VestaKilnClipDataSourceProtocol& clip, const std::string& name,
                            const ClipIngestOptions& options, const std::string& destination,
                            const ClipIngestProgress& progress) override {
        ClipIngest job(clip, name, options);
        return job.run(destination, progress);
    }
    void requestStop() override { ClipIngest::requestStop(); }
    bool stopRequested() override { return ClipIngest::stopRequested(); }
};

}  // namespace

extern "C" __attribute__((visibility("default"))) ClipIngestModule* SkarnMovieModule() {
    static Module module;
    return &module;
}
