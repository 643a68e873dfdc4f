#pragma once

#include "system/log.h"
