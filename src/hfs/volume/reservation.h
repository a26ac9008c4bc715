// A reservation of nodes for the length of a scope.
#pragma once

#include "hfs/treehfs.h"

namespace VELK {

class Reservation {
public:
    explicit Reservation(CBTreeHfs* tree) : tree_(tree) {}
    Reservation(const Reservation&) = delete;
    Reservation& operator=(const Reservation&) = delete;
    ~Reservation() { Release(); }

    // `low` and `high` as ReserveSpace packs them.
    int Reserve(u16 low, u16 high) {
        const u32 request = (static_cast<u32>(high) << 16) | low;
        const int status = tree_->ReserveSpace(static_cast<int>(request), &reserve_);
        held_ = status == 0;
        return status;
    }
    // Safe to repeat. Call it before a restore.
    void Release() {
        if (held_) {
            tree_->ReleaseSpace(&reserve_);
            held_ = false;
        }
    }
    const BTReserve& Get() const { return reserve_; }

private:
    CBTreeHfs* tree_;
    BTReserve reserve_{};
    bool held_ = false;
};

}  // namespace VELK
