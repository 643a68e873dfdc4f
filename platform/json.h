#pragma once

#include "system/json.h"
