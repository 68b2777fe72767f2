"""tests/bus/conftest.py: the fixtures of the bus ring."""
pytest_plugins = ["harness.service_fixtures", "harness.stage_fixtures", "harness.device_fixtures"]
