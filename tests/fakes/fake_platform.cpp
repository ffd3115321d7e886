// Proves that the header stands alone.
#include "tests/fakes/fake_platform.h"
