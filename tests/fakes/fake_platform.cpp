#include "fakes/fake_platform.h"

namespace quorlet {

// Here, so that not every test compiles the services that it does not look at.
FakePlatform::FakePlatform() = default;
FakePlatform::~FakePlatform() = default;

}  // namespace quorlet
