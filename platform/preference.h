#pragma once

#include "system/preference.h"
