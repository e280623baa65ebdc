#include "host/flow/SubInputs.h"

#include "host/flow/Operator.h"

namespace Orvane {

SubInputs::Adding::Adding(SubInputs &group)
    : group_(group), saved_(group.owner_->CurrentGroup()), first_(group.owner_->Inputs().size()) {
    group_.owner_->SetCurrentGroup(group_.group_);
}

SubInputs::Adding::~Adding() {
    const auto &all = group_.owner_->Inputs();
    for (size_t i = first_; i < all.size(); ++i) group_.inputs_.push_back(all[i].get());
    group_.owner_->SetCurrentGroup(saved_);
}

} // namespace Orvane
