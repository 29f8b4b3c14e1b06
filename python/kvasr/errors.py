# SPDX-License-Identifier: Apache-2.0
"""The one exception type of this package."""


class KvasrError(RuntimeError):
    """A library call failed; the message says which and quotes what the
    library logged about it."""
