-- Drives neovim's own LSP client against the scope server (run by
-- tests/test_lsp_neovim.py as `nvim --headless --clean -c 'luafile ...'`).
--
-- Opens SCOPE_NVIM_FILE, attaches the server started with SCOPE_NVIM_PYTHON
-- (PYTHONPATH and SCOPESERVER_DOCUMENT from the same-named SCOPE_NVIM_
-- variables), edits the buffer through the editor's own buffer calls, so
-- that the client computes and sends the incremental changes, and after
-- each step asks for the document symbols and folding ranges. Every answer
-- goes with the buffer's lines to the JSON file SCOPE_NVIM_OUT, where the
-- test holds it against a fresh read of the same text.
--
-- SCOPE_NVIM_DEBOUNCE is the client's debounce in milliseconds: 0 sends each
-- buffer change as its own didChange (a version of its own: the lines after
-- each are recorded too), a long one sends a step's changes together when
-- the request flushes them.

local api = vim.api
local out_path = os.getenv('SCOPE_NVIM_OUT')
local record = { steps = {} }

local function write_out()
  vim.fn.writefile({ vim.fn.json_encode(record) }, out_path)
end

local function wait(what, predicate)
  if not vim.wait(20000, predicate, 10) then
    error('timed out waiting for ' .. what)
  end
end

local function main()
  local env = { PYTHONPATH = os.getenv('SCOPE_NVIM_PYTHONPATH') }
  local document = os.getenv('SCOPE_NVIM_DOCUMENT')
  if document and document ~= '' then
    env.SCOPESERVER_DOCUMENT = document
  end
  local preload = os.getenv('SCOPE_NVIM_PRELOAD')
  if preload and preload ~= '' then
    env.LD_PRELOAD = preload
  end
  vim.cmd('edit ' .. vim.fn.fnameescape(os.getenv('SCOPE_NVIM_FILE')))
  local buf = api.nvim_get_current_buf()
  local exited = nil
  local client_id = vim.lsp.start_client({
    name = 'scopeserver',
    cmd = { os.getenv('SCOPE_NVIM_PYTHON'), '-m', 'pysource.scopeserver' },
    cmd_env = env,
    root_dir = vim.fn.getcwd(),
    flags = { debounce_text_changes = tonumber(os.getenv('SCOPE_NVIM_DEBOUNCE')) },
    on_exit = function(code, signal) exited = { code = code, signal = signal } end,
  })
  if not client_id then
    error('the server did not start')
  end
  local client = vim.lsp.get_client_by_id(client_id)
  wait('initialize', function() return client.initialized or exited ~= nil end)
  if exited then
    error('the server exited at start: ' .. vim.inspect(exited))
  end
  record.capabilities = client.server_capabilities
  vim.lsp.buf_attach_client(buf, client_id)
  local uri = vim.uri_from_bufnr(buf)
  local between = {}
  api.nvim_buf_attach(buf, false, { on_lines = function()
    table.insert(between, api.nvim_buf_get_lines(buf, 0, -1, true))
  end })

  local function ask(method, params)
    local answers, err = vim.lsp.buf_request_sync(buf, method, params, 20000)
    if not answers then
      error(method .. ': ' .. tostring(err))
    end
    local answer = answers[client_id]
    if answer.err then
      error(method .. ': ' .. vim.inspect(answer.err))
    end
    return answer.result
  end

  local function snapshot(name)
    table.insert(record.steps, {
      step = name,
      between = between,
      lines = api.nvim_buf_get_lines(buf, 0, -1, true),
      eol = api.nvim_buf_get_option(buf, 'eol'),
      symbols = ask('textDocument/documentSymbol', { textDocument = { uri = uri } }),
      folding = ask('textDocument/foldingRange', { textDocument = { uri = uri } }),
    })
    between = {}
  end

  local function line(row) return api.nvim_buf_get_lines(buf, row, row + 1, true)[1] end
  local function find(pattern, from)
    local lines = api.nvim_buf_get_lines(buf, 0, -1, true)
    for i = (from or 0) + 1, #lines do
      if lines[i]:match(pattern) then return i - 1 end
    end
    error('no line matches ' .. pattern)
  end
  -- Typing: one buffer change per character, as insert mode makes them.
  local function type_at(row, col, text)
    for ch in text:gmatch('[%z\1-\127\194-\244][\128-\191]*') do
      api.nvim_buf_set_text(buf, row, col, row, col, { ch })
      col = col + #ch
    end
    return col
  end
  local function backspace(row, col, count)
    for _ = 1, count do
      local before = line(row):sub(1, col)
      local start = vim.str_byteindex(before, vim.str_utfindex(before) - 1)
      api.nvim_buf_set_text(buf, row, start, row, col, { '' })
      col = start
    end
    return col
  end

  snapshot('opened')
  local class_row = find('^class ')
  local def_row = find('^    def ', class_row)
  -- A method typed in, character by character, with Enter between lines.
  api.nvim_buf_set_lines(buf, def_row, def_row, true, { '' })
  local col = type_at(def_row, 0, '    def typed(self, x):')
  snapshot('method header typed')
  api.nvim_buf_set_text(buf, def_row, col, def_row, col, { '', '        ' })
  type_at(def_row + 1, 8, 'return x + 1')
  api.nvim_buf_set_text(buf, def_row + 1, #line(def_row + 1), def_row + 1, #line(def_row + 1), { '', '' })
  snapshot('method body typed')
  -- Deleting: backspace through the parameter, then the name changes.
  col = backspace(def_row, #'    def typed(self, x', 3)
  snapshot('parameter deleted')
  backspace(def_row, #'    def typed', 2)
  type_at(def_row, #'    def typ', 'o')
  snapshot('method renamed')
  -- Enter inside a line, then the two lines joined again.
  local body = def_row + 1
  api.nvim_buf_set_text(buf, body, 14, body, 14, { '', '            ' })
  snapshot('enter in a line')
  api.nvim_buf_set_text(buf, body, #line(body), body + 1, 12, { '' })
  snapshot('lines joined')
  -- A docstring opened (the text stops reading), typed into, then closed.
  type_at(body, 8, '"""')
  snapshot('docstring opened')
  type_at(body, 11, 'Adds one. ')
  snapshot('typed in the open docstring')
  type_at(body, #line(body), '"""')
  snapshot('docstring closed')
  api.nvim_buf_set_lines(buf, body, body + 1, true, { '        return x + 1' })
  snapshot('docstring deleted')
  -- Characters outside ASCII and outside the BMP before typed ones.
  col = type_at(def_row, #line(def_row), '  # \195\169\240\159\152\128 ')
  type_at(def_row, col, 'x')
  snapshot('non-ASCII typed')
  -- The method dedented to the module, then indented back.
  api.nvim_buf_set_text(buf, def_row, 0, def_row, 4, { '' })
  snapshot('method dedented')
  api.nvim_buf_set_text(buf, def_row, 0, def_row, 0, { '    ' })
  snapshot('method indented')
  -- Whole lines: a class at the top, lines at the end, a method removed.
  api.nvim_buf_set_lines(buf, 0, 0, true, { 'class Top(object):', '    def top(self):', '        pass', '' })
  snapshot('class inserted at the top')
  local count = api.nvim_buf_line_count(buf)
  api.nvim_buf_set_lines(buf, count, count, true, { '', 'def last():', '    return (', '        1)' })
  snapshot('function appended')
  api.nvim_buf_set_lines(buf, count + 2, count + 4, true, {})
  snapshot('body at the end deleted')
  local typed = find('^    def typo', 0)
  api.nvim_buf_set_lines(buf, typed, typed + 2, true, {})
  snapshot('method removed')

  record.scope_at = ask('scope/scopeAt', { textDocument = { uri = uri },
                                           position = { line = find('^    def top') + 1, character = 4 } })
  record.hover = ask('textDocument/hover', { textDocument = { uri = uri },
                                             position = { line = 2, character = 0 } })
  vim.lsp.stop_client(client_id)
  wait('the server to exit', function() return exited ~= nil end)
  record.exit = exited
end

local ok, err = pcall(main)
if not ok then
  record.error = tostring(err)
end
write_out()
vim.cmd('qall!')
