// The whole interface of libnorvo.
#pragma once
#include "norvo/errors.h"
#include "norvo/norvodir.h"
#include "norvo/norvoenum.h"
#include "norvo/norvomisc.h"
#include "norvo/norvoprogress.h"
#include "norvo/norvosearch.h"
#include "norvo/norvoupload.h"
#include "norvo/norvouser.h"
#include "norvo/nvoman.h"
#include "norvo/pathinfo.h"
#include "norvo/subdirs.h"
