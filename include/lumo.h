// All exported declarations of the lumo library.
#pragma once

#include "lumo_types.h"
#include "lumo_dispatch.h"
#include "lumo_poly.h"
