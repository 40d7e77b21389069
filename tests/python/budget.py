"""How long hypothesis looks for counterexamples: for as many examples a test as VELTRA_EXAMPLES says, else the same few each time."""
import os

from hypothesis import HealthCheck, settings

examples = int(os.environ.get("VELTRA_EXAMPLES", 0))
settings.register_profile("veltra", max_examples=examples or 40, derandomize=not examples, deadline=None, database=None,
                          suppress_health_check=list(HealthCheck))
settings.load_profile("veltra")
