// Recording and failing, in front of another device.
#include "recording_device.h"

namespace VELK::test {

IoResult RecordingDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    const IoResult result = base_->Write(offset, source, bytes);
    if (result.Ok()) {
        const u8* in = static_cast<const u8*>(source);
        log_->push_back({false, offset, std::vector<u8>(in, in + bytes)});
    }
    return result;
}

IoResult RecordingDevice::Sync() {
    const IoResult result = base_->Sync();
    if (result.Ok()) {
        log_->push_back({true, 0, {}});
    }
    return result;
}

bool FaultyDevice::Strikes(u32* calls, u32 nth) {
    *calls += 1;
    const bool strikes = nth != 0 && (*calls == nth || (*calls > nth && faults_->forEver));
    faults_->hasFailed = faults_->hasFailed || strikes;
    return strikes;
}

IoResult FaultyDevice::Read(u64 offset, void* target, std::size_t bytes) {
    if (Strikes(&faults_->reads, faults_->failRead)) {
        return {faults_->error, offset};
    }
    if (offset + bytes > faults_->sizeLimit) {
        return {kIoPastEnd, offset};
    }
    return base_->Read(offset, target, bytes);
}

IoResult FaultyDevice::Write(u64 offset, const void* source, std::size_t bytes) {
    faults_->changesAfterFailure += faults_->syncHasFailed ? 1 : 0;
    if (Strikes(&faults_->writes, faults_->failWrite)) {
        const std::size_t part = bytes / 2 / kSectorSize * kSectorSize;
        if (faults_->writesPart && part != 0) {
            const IoResult result = base_->Write(offset, source, part);
            return result.Ok() ? IoResult{faults_->error, offset + part} : result;
        }
        return {faults_->error, offset};
    }
    if (offset + bytes > faults_->sizeLimit) {
        return {kIoPastEnd, offset};
    }
    return base_->Write(offset, source, bytes);
}

IoResult FaultyDevice::Sync() {
    if (Strikes(&faults_->syncs, faults_->failSync)) {
        faults_->syncHasFailed = true;
        return {faults_->error, 0};
    }
    return base_->Sync();
}

}  // namespace VELK::test
